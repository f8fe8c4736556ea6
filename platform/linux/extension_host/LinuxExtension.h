// An installed extension, and the process that serves its requests.
//
// All requests of one object share one process, which is started by the first and lingers after the last. While it runs a request begins
// inside the call that asks for it; a request that must wait for a process begins on the spawner's thread.
#pragma once

#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "platform/QXValue.h"
#include "platform/extension_host.h"
#include "platform/linux/base/Paths.h"
#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/extension_host/ExtensionProcess.h"
#include "platform/linux/extension_host/ExtensionTimes.h"
#include "platform/linux/extension_host/ProcessLifetime.h"
#include "platform/linux/extension_host/ProcessSpawner.h"
#include "platform/linux/extension_host/Timer.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

// What the extensions of one host share. The references outlive the extensions.
struct ExtensionServices {
  ExtensionServices(Paths allPaths, Reactor& itsReactor, QXLogHandle& itsLog, const ExtensionTimes& itsTimes)
      : paths(std::move(allPaths)), reactor(itsReactor), log(itsLog), times(itsTimes) {}

  Paths paths;
  Reactor& reactor;
  QXLogHandle& log;
  ExtensionTimes times;
  ProcessSpawner spawner;
};

class LinuxExtension : public QXExtension, public std::enable_shared_from_this<LinuxExtension> {
 public:
  [[nodiscard]] static std::shared_ptr<LinuxExtension> create(Bundle bundle, QXExtensionContextClass contextClass,
                                                              std::shared_ptr<ExtensionServices> services);
  // Ends its process at once; messages that wait for an answer fail.
  ~LinuxExtension() override;

  [[nodiscard]] const Bundle& bundle() const { return bundle_; }

  [[nodiscard]] std::optional<std::string> identifier() const override { return bundle_.identifier; }
  // "<QXExtension com.orvane.cellar>"
  [[nodiscard]] std::string description() const override { return "<QXExtension " + bundle_.identifier + ">"; }
  [[nodiscard]] bool isEqual(const QXExtension& other) const override;

  void beginExtensionRequest(BeginCompletion completion) override;
  void cancelExtensionRequest(const QXUUID& request) override;
  [[nodiscard]] std::shared_ptr<QXExtensionContext> extensionContextForRequest(const QXUUID& request) override;

  enum class Retirement {
    atOnce,      // the bundle was removed, or has lost something that the process has
    afterGrace,  // it was updated
  };
  // The bundle is not what it was. At once: its process is ended, messages and requests that wait fail, and so do requests from now on.
  // After the grace: the same then (ExtensionTimes::updateGrace); until then requests are served as before, but the process does not
  // linger. May be called again; the first end counts. Completions of requests that wait for a process run before it returns.
  void retire(Retirement how);
  // What LinuxExtensionHost::status says of it; nothing once it is retired and has neither a process nor requests.
  [[nodiscard]] std::optional<QXDictionary> status() const;
  // The host goes: ends the process at once; requests fail from now on.
  void stop();

 private:
  struct Waiting {
    QXUUID request;
    BeginCompletion completion;
  };

  LinuxExtension(Bundle bundle, QXExtensionContextClass contextClass, std::shared_ptr<ExtensionServices> services);

  [[nodiscard]] std::shared_ptr<ExtensionProcess> presentProcess() const;
  // False: there is none to be had, and a process would never be let go.
  [[nodiscard]] bool hasEndTimer();
  void startOnSpawner();
  void start();
  [[nodiscard]] std::variant<std::shared_ptr<ExtensionProcess>, QXError> makeProcess();
  void didStart(std::shared_ptr<ExtensionProcess> process);
  void didNotStart(const QXError& why);
  [[nodiscard]] bool isOver() const;
  [[nodiscard]] bool hasRequests() const;
  void processIsLost(ProcessLifetime::Cause cause);
  void processIsGone();
  // Ends the process when it has been idle for long, or is over.
  void endWhenDue();
  // With the lock.
  void setEndTimer();
  [[nodiscard]] std::chrono::milliseconds backOffLeft() const;
  [[nodiscard]] QXError refusalError() const;
  [[nodiscard]] QXError backingOffError() const;

  // Constant after construction.
  const Bundle bundle_;
  const QXExtensionContextClass contextClass_;
  const std::shared_ptr<ExtensionServices> services_;
  mutable std::mutex mutex_;         // guards all below; no handler and no operation of a process is called with it
  std::unique_ptr<Timer> endTimer_;  // none before the first process
  ProcessLifetime lifetime_;
  std::vector<Waiting> waiting_;
  std::shared_ptr<ExtensionProcess> process_;
  bool endTimerIsSet_ = false;
  bool isStopped_ = false;
};

}  // namespace docuvend::linux_platform
