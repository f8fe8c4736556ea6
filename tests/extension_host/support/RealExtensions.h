// An extension host over real, confined processes in a throw-away home. Never as root: root passes checks that users do not.
#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <condition_variable>
#include <functional>
#include <future>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/FakeLog.h"
#include "platform/linux/base/Paths.h"
#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/extension_host/LinuxExtensionHost.h"
#include "platform/linux/wire/Reactor.h"
#include "providers/_QXDocuvendHostProtocol.h"
#include "providers/_QXDocuvendVendor.h"

namespace docuvend::linux_platform {

// How long a test waits for what must come, before it fails.
inline constexpr std::chrono::seconds kPatience{60};

inline constexpr const char* kPoint = "com.orvane.docuvend-nonui";

// What a future brings; a test failure and nothing when it brings nothing.
template <class T>
std::optional<T> await(std::future<T> future) {
  if (future.wait_for(kPatience) == std::future_status::ready) return future.get();
  ADD_FAILURE() << "nothing came within " << kPatience.count() << " s";
  return std::nullopt;
}

// What is installed, as the test says.
class InstalledByTest : public BundleRegistry {
 public:
  [[nodiscard]] std::optional<Bundle> find(const std::string& identifier) override;
  [[nodiscard]] std::vector<Bundle> all() override;
  void onChange(std::function<void()> callback) override;

  void set(std::vector<Bundle> bundles);

 private:
  std::mutex mutex_;  // guards both
  std::vector<Bundle> bundles_;
  std::vector<std::function<void()>> callbacks_;
};

// The sets that a match handler was given.
class Reports {
 public:
  using Set = std::vector<std::shared_ptr<QXExtension>>;

  void add(Set set);
  // The report of that number, counted from 0, when it is there.
  [[nodiscard]] std::optional<Set> await(std::size_t number);
  [[nodiscard]] std::size_t count();

 private:
  std::mutex mutex_;  // guards the sets
  std::vector<Set> sets_;
  std::condition_variable changed_;
};

struct Begun {
  std::optional<QXUUID> request;
  std::optional<QXError> error;
};

// How a message ended: with the values of its answer, or with an error.
struct Answer {
  QXArray values;
  std::optional<QXError> error;
};

class RealExtensions {
 public:
  explicit RealExtensions(const ExtensionTimes& times = {});
  ~RealExtensions();
  RealExtensions(const RealExtensions&) = delete;
  RealExtensions& operator=(const RealExtensions&) = delete;

  // False, and a test failure: this is root.
  [[nodiscard]] static bool mayRun();

  // A bundle of that program (of this build), copied into the home the first time. Not installed yet.
  [[nodiscard]] Bundle makeBundle(const std::string& identifier, const std::string& program = "docuvend-test-provider");
  void install(std::vector<Bundle> bundles) { registry_.set(std::move(bundles)); }

  [[nodiscard]] LinuxExtensionHost& host() { return *host_; }
  void dropHost() { host_.reset(); }
  // Of that extension; empty when the host tells nothing of it.
  [[nodiscard]] QXDictionary status(const std::string& identifier = "com.orvane.test") const;
  [[nodiscard]] std::unique_ptr<QXExtensionMatch> match(Reports& reports);
  // Installs these alone and gives their extensions, in order of identifier.
  [[nodiscard]] Reports::Set extensions(std::vector<Bundle> bundles);
  [[nodiscard]] std::shared_ptr<QXExtension> extension(const std::string& identifier = "com.orvane.test");

  // Lets that extension's processes answer what they wait with.
  void release(const std::string& identifier = "com.orvane.test") const;

  [[nodiscard]] const std::string& home() const { return home_; }
  [[nodiscard]] fake_platform::FakeLog& log() { return log_; }
  // Waits until a line that contains the text is in the log.
  [[nodiscard]] bool awaitLog(const std::string& text);

 private:
  std::string home_;
  Paths paths_;
  fake_platform::FakeLog log_;
  InstalledByTest registry_;
  Reactor reactor_{2};
  QXRpcInterface hostInterface_ = qxInterfaceOf<_QXDocuvendHostProtocol>();
  QXRpcInterface vendorInterface_ = qxInterfaceOf<_QXDocuvendVendor>();
  std::unique_ptr<LinuxExtensionHost> host_;
  Reports reports_;
  std::unique_ptr<QXExtensionMatch> match_;
};

[[nodiscard]] std::optional<Begun> begin(QXExtension& extension);

// One request, ended when this goes.
class Conversation {
 public:
  explicit Conversation(std::shared_ptr<QXExtension> extension);
  ~Conversation();
  Conversation(const Conversation&) = delete;
  Conversation& operator=(const Conversation&) = delete;

  [[nodiscard]] const std::optional<QXError>& error() const { return error_; }
  [[nodiscard]] const QXUUID& request() const { return request_; }
  [[nodiscard]] std::shared_ptr<QXRpcConnection> connection() const;

  // The operations with the URL of a file of that name; the answer comes later.
  [[nodiscard]] std::future<Answer> identify(const std::string& name) const;
  [[nodiscard]] std::future<Answer> start(const std::string& name) const;
  [[nodiscard]] std::future<Answer> locate(const std::string& identifier) const;
  // What `identify` answers, or the description of the error.
  [[nodiscard]] std::string identifier(const std::string& name) const;

  [[nodiscard]] std::future<Answer> send(const char* operationName, QXArray arguments) const;

 private:
  std::shared_ptr<QXExtension> extension_;
  QXUUID request_;
  std::optional<QXError> error_;
  std::shared_ptr<QXExtensionContext> context_;
};

}  // namespace docuvend::linux_platform
