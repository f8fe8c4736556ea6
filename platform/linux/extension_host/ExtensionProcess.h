// A running process of an extension, from its spawning to its reaping.
//
// Its connection is that of all its requests. When the connection is over for any reason, messages that wait for an answer fail and the
// process is ended; when an answer that must be quick is overdue, the same. As long as something is expected of it (it has requests, or a
// message waits for its answer) the process is asked for signs of life, which must be quick too: the thread that reads its connection gives
// them, so they tell a process that hangs from one that works. The handlers run on threads of the reactor, one at a time.
#pragma once

#include <atomic>
#include <cstddef>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/extension_host/AnswerDeadlines.h"
#include "platform/linux/extension_host/ExtensionTimes.h"
#include "platform/linux/extension_host/OutputLog.h"
#include "platform/linux/extension_host/ProcessLifetime.h"
#include "platform/linux/extension_host/ProcessSpawner.h"
#include "platform/linux/extension_host/Timer.h"
#include "platform/linux/wire/CallBudget.h"
#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/Limits.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/log.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

class ExtensionProcess : public std::enable_shared_from_this<ExtensionProcess> {
 public:
  // Of the messages that may wait for an answer so many are kept for what applications do not ask for: that items have changed, and the
  // setup. A message that finds no room fails like one that finds none on the connection.
  static constexpr std::size_t kRoomForNotices = 128;
  static constexpr std::size_t kMaximumQuestions = kMaximumPendingCalls - kRoomForNotices;

  struct Handlers {
    // The process is of no more use, though nobody asked for its end. At most once.
    std::function<void(ProcessLifetime::Cause)> onLost;
    // The process is gone. Once, after onLost.
    std::function<void()> onGone;
    // Asked from time to time.
    std::function<bool()> hasRequests;
  };
  struct Ends {
    SpawnedProcess process;
    UniqueDescriptor socket;  // ours
    UniqueDescriptor output;  // the reading end
  };

  // Nothing is read and no handler called before `resume`. Null: the process could not be watched, and is ended.
  [[nodiscard]] static std::shared_ptr<ExtensionProcess> create(Ends ends, const std::string& identifier, const QXRpcInterface& exported,
                                                                const ExtensionTimes& times, Reactor& reactor, QXLogHandle& log,
                                                                Handlers handlers);
  // Ends the process at once if it is still there.
  ~ExtensionProcess();
  ExtensionProcess(const ExtensionProcess&) = delete;
  ExtensionProcess& operator=(const ExtensionProcess&) = delete;

  void resume();
  // Closes the connection; then, if that does not make the process end by itself, by signal.
  void end();
  // Without any such patience, because the host stops.
  void endAtOnce();
  // The same, because its bundle was removed or replaced: an answer that is on its way is not taken any more. The log tells of it.
  void endWithItsBundle();
  // Looks whether the connection is over. Messages are told of that before anybody else is, so whoever tries again at once must look.
  void noticeEnd();

  // A request has begun: sees to it that the process is asked for signs of life.
  void watchLiveness();

  [[nodiscard]] int number() const { return process_.number; }
  // A proxy of the connection that watches over the answers which must be quick.
  [[nodiscard]] std::shared_ptr<QXRpcProxy> remoteObjectProxy(QXErrorHandler errorHandler);

 private:
  class Proxy;
  // All that is to be known of it can be known.
  [[nodiscard]] bool isWatched() const;

  enum class Stage { alive, closed, terminated, killed };

  ExtensionProcess(Ends ends, std::string identifier, const ExtensionTimes& times, Reactor& reactor, QXLogHandle& log, Handlers handlers);

  void connectionIsOver();
  // False: not dead yet.
  [[nodiscard]] bool reap();
  void graceIsOver();
  void lookForOverdueAnswers();
  void askForSignOfLife();
  // With the event lock.
  void endAtOnceBecause(const QXError& why);
  void closeAndKill(const QXError& why);
  [[nodiscard]] AnswerDeadlines::Message expectAnswer(AnswerLine line, const std::string& operationName);
  void gotAnswer(const AnswerDeadlines::Message& message);

  // Constant after `create`.
  const std::string identifier_;
  const ExtensionTimes times_;
  QXLogHandle& log_;
  const Handlers handlers_;
  const SpawnedProcess process_;
  UniqueDescriptor socketProbe_;  // the same socket as the endpoint's, to look at
  std::shared_ptr<Endpoint> endpoint_;
  std::unique_ptr<OutputLog> output_;
  std::unique_ptr<Timer> graceTimer_;
  std::unique_ptr<Timer> answerTimer_;
  std::unique_ptr<Timer> livenessTimer_;

  const Reactor::Poster post_;
  const std::shared_ptr<CallBudget> questions_;

  std::atomic<bool> livenessTimerIsSet_ = false;
  std::atomic<bool> pingIsUnanswered_ = false;

  std::mutex deadlinesMutex_;  // guards the deadlines and nothing else; nothing is called with it
  AnswerDeadlines deadlines_;

  std::mutex eventMutex_;  // guards the four below, and is held while a handler runs
  Stage stage_ = Stage::alive;
  bool isLetGo_ = false;
  bool isReaped_ = false;
  std::shared_ptr<Reactor::Registration> death_;
};

}  // namespace docuvend::linux_platform
