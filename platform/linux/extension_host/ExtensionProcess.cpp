// How a process ends
//
//   alive ──(end)──────────────▶ closed ──(grace)──▶ terminated ──(grace)──▶ killed ──▶ reaped
//     └──(connection over, death, overdue answer, bundle gone)─────────────▶ killed ──▶ reaped
//
// A process whose connection is over without our doing can do nothing more for us, and one whose bundle is gone must not, so they are
// killed at once; one that we let go may finish what it is about. Every signal goes through the pidfd, so it can reach no other process.
// From any stage the process may die by itself; whatever comes, it is reaped exactly once, by the watch on the pidfd or by the destructor.
//
// Killing and reaping happen under the event lock, so what is killed has not been reaped.
//
// Two threads may see the end at the same time, one on the socket and one on the pidfd. The event lock puts them in a row: the stage leaves
// `alive` once, and onLost is through before onGone begins.
#include "platform/linux/extension_host/ExtensionProcess.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/epoll.h>
#include <sys/wait.h>

#include <chrono>
#include <cstdint>
#include <limits>
#include <string_view>
#include <utility>

#include "platform/QXLogMessage.h"
#include "platform/linux/base/pidfd.h"
#include "platform/linux/extension_host/ExtensionErrors.h"
#include "platform/linux/extension_host/ProcessTree.h"
#include "platform/rpc_errors.h"

namespace docuvend::linux_platform {
namespace {

using Clock = std::chrono::steady_clock;

std::string describeEnd(const siginfo_t& info) {
  if (info.si_code == CLD_EXITED) return "exited with status " + std::to_string(info.si_status);
  return "was ended by signal " + std::to_string(info.si_status);
}

// Which messages are sent because an application asks for something. It may do so any number of times, unlike what the others come of.
bool isQuestion(std::string_view operationName) {
  return operationName != "_itemChangedAtURL:completion:" && operationName != "_performInitialSetupWithCompletion:";
}

QXError tooManyQuestions() {
  return QXError::make(kQXRpcErrorDomain, static_cast<std::int64_t>(QXRpcErrorCode::tooManyCalls),
                       "too many messages wait for their answers");
}

}  // namespace

// Messages without a limit go straight to the endpoint; each limited one gets an error handler of its own, because the failure of a message
// must be told apart from that of another.
class ExtensionProcess::Proxy : public QXRpcProxy {
 public:
  Proxy(std::weak_ptr<ExtensionProcess> process, std::shared_ptr<Endpoint> endpoint, QXErrorHandler errorHandler)
      : process_(std::move(process)),
        endpoint_(std::move(endpoint)),
        errorHandler_(std::move(errorHandler)),
        plain_(endpoint_->remoteObjectProxy(errorHandler_)) {}

  void send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) override {
    const auto process = reply ? process_.lock() : nullptr;
    if (!process) {
      plain_->send(operation, std::move(arguments), std::move(reply));
      return;
    }
    if (isQuestion(operation.name)) {
      std::shared_ptr<CallBudget::Share> share = process->questions_->take(/*bytes=*/0);
      if (!share) {
        process->post_([errorHandler = errorHandler_] {
          if (errorHandler) errorHandler(tooManyQuestions());
        });
        return;
      }
      reply = [share = std::move(share), reply = std::move(reply)](QXArray values) mutable {
        share.reset();
        reply(std::move(values));
      };
    }
    if (const auto line = answerLineOf(operation.name)) {
      sendLimited(*process, *line, operation, std::move(arguments), std::move(reply));
    } else {
      plain_->send(operation, std::move(arguments), std::move(reply));
    }
    // Not before: a look that comes in between would find nothing to wait for, and be the last.
    process->watchLiveness();
  }

 private:
  void sendLimited(ExtensionProcess& process, AnswerLine line, const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) {
    const AnswerDeadlines::Message message = process.expectAnswer(line, operation.name);
    const auto limited = endpoint_->remoteObjectProxy([weak = process_, message, errorHandler = errorHandler_](const QXError& error) {
      if (const auto strongProcess = weak.lock()) strongProcess->gotAnswer(message);
      if (errorHandler) errorHandler(error);
    });
    limited->send(operation, std::move(arguments), [weak = process_, message, reply = std::move(reply)](QXArray values) {
      if (const auto strongProcess = weak.lock()) strongProcess->gotAnswer(message);
      reply(std::move(values));
    });
  }

  std::weak_ptr<ExtensionProcess> process_;
  std::shared_ptr<Endpoint> endpoint_;
  QXErrorHandler errorHandler_;
  std::shared_ptr<QXRpcProxy> plain_;
};

ExtensionProcess::ExtensionProcess(Ends ends, std::string identifier, const ExtensionTimes& times, Reactor& reactor, QXLogHandle& log,
                                   Handlers handlers)
    : identifier_(std::move(identifier)),
      times_(times),
      log_(log),
      handlers_(std::move(handlers)),
      process_(std::move(ends.process)),
      post_(reactor.poster()),
      questions_(std::make_shared<CallBudget>(CallLimits{kMaximumQuestions, std::numeric_limits<std::size_t>::max()})),
      deadlines_(times.answerLimit) {}

std::shared_ptr<ExtensionProcess> ExtensionProcess::create(Ends ends, const std::string& identifier, const QXRpcInterface& exported,
                                                           const ExtensionTimes& times, Reactor& reactor, QXLogHandle& log,
                                                           Handlers handlers) {
  UniqueDescriptor socket = std::move(ends.socket);
  UniqueDescriptor output = std::move(ends.output);
  const std::shared_ptr<ExtensionProcess> process(
      new ExtensionProcess(std::move(ends), identifier, times, reactor, log, std::move(handlers)));
  const std::weak_ptr<ExtensionProcess> weak = process;
  process->socketProbe_.reset(fcntl(socket.get(), F_DUPFD_CLOEXEC, 0));

  Endpoint::Handlers endpointHandlers;
  endpointHandlers.onClose = [weak](const QXError&) {
    if (const auto strongSelf = weak.lock()) strongSelf->connectionIsOver();
  };
  process->endpoint_ = Endpoint::create(reactor, std::move(socket), Hello{}, std::move(endpointHandlers));
  process->endpoint_->setExportedInterface(exported);
  process->output_ = std::make_unique<OutputLog>(reactor, log, identifier, std::move(output));
  process->graceTimer_ = std::make_unique<Timer>(reactor, [weak] {
    if (const auto strongSelf = weak.lock()) strongSelf->graceIsOver();
  });
  process->answerTimer_ = std::make_unique<Timer>(reactor, [weak] {
    if (const auto strongSelf = weak.lock()) strongSelf->lookForOverdueAnswers();
  });
  process->livenessTimer_ = std::make_unique<Timer>(reactor, [weak] {
    if (const auto strongSelf = weak.lock()) strongSelf->askForSignOfLife();
  });
  {
    const std::lock_guard lock(process->eventMutex_);
    process->death_ = reactor.watch(process->process_.descriptor.get(), /*events=*/0, [weak](std::uint32_t) -> std::uint32_t {
      const auto strongSelf = weak.lock();
      if (strongSelf && !strongSelf->reap()) return EPOLLIN;
      return 0;
    });
    if (!process->death_) return nullptr;
  }
  return process->isWatched() ? process : nullptr;
}

bool ExtensionProcess::isWatched() const {
  return socketProbe_ && output_->isUsable() && graceTimer_->isUsable() && answerTimer_->isUsable() && livenessTimer_->isUsable();
}

ExtensionProcess::~ExtensionProcess() {
  endpoint_->close(extensionHostError(ExtensionHostErrorCode::stopped, "The process of " + identifier_ + " was let go."));
  death_.reset();
  if (isReaped_) return;
  endProcessTree(process_);
  siginfo_t info{};
  waitid(P_PIDFD, static_cast<id_t>(process_.descriptor.get()), &info, WEXITED);
}

void ExtensionProcess::resume() {
  endpoint_->resume();
  const std::lock_guard lock(eventMutex_);
  death_->rearm(EPOLLIN);
}

void ExtensionProcess::end() {
  {
    const std::lock_guard lock(eventMutex_);
    if (stage_ != Stage::alive) return;
    stage_ = Stage::closed;
    isLetGo_ = true;
  }
  endpoint_->close(extensionHostError(ExtensionHostErrorCode::ended, "The process of " + identifier_ + " was let go."));
  graceTimer_->setFor(Clock::now() + times_.endGrace);
}

void ExtensionProcess::endAtOnce() {
  const std::lock_guard lock(eventMutex_);
  endAtOnceBecause(extensionHostError(ExtensionHostErrorCode::stopped, "The extension host is stopping."));
}

void ExtensionProcess::endWithItsBundle() {
  const std::lock_guard lock(eventMutex_);
  if (stage_ == Stage::alive) qxLog(log_, "[NOTICE] The bundle of %@ was removed or replaced: its process is ended.", identifier_);
  endAtOnceBecause(bundleIsGoneError(identifier_));
}

void ExtensionProcess::endAtOnceBecause(const QXError& why) {
  if (stage_ == Stage::killed) return;
  isLetGo_ = true;
  if (std::exchange(stage_, Stage::killed) == Stage::alive) handlers_.onLost(ProcessLifetime::Cause::died);
  closeAndKill(why);
}

std::shared_ptr<QXRpcProxy> ExtensionProcess::remoteObjectProxy(QXErrorHandler errorHandler) {
  return std::make_shared<Proxy>(weak_from_this(), endpoint_, std::move(errorHandler));
}

void ExtensionProcess::noticeEnd() {
  pollfd probe{socketProbe_.get(), POLLRDHUP, 0};
  if (poll(&probe, 1, 0) > 0) connectionIsOver();
}

void ExtensionProcess::connectionIsOver() {
  const std::lock_guard lock(eventMutex_);
  if (stage_ != Stage::alive) return;
  stage_ = Stage::killed;
  endProcessTree(process_);
  handlers_.onLost(ProcessLifetime::Cause::died);
}

bool ExtensionProcess::reap() {
  std::string how;
  Stage before = Stage::alive;
  bool isExpected = false;
  {
    const std::lock_guard lock(eventMutex_);
    siginfo_t info{};
    if (waitid(P_PIDFD, static_cast<id_t>(process_.descriptor.get()), &info, WEXITED | WNOHANG) != 0 || info.si_pid == 0) return false;
    how = describeEnd(info);
    isReaped_ = true;
    isExpected = isLetGo_;
    before = std::exchange(stage_, Stage::killed);
    // Before the messages fail: whoever tries again then must not be sent to this process.
    if (before == Stage::alive) handlers_.onLost(ProcessLifetime::Cause::died);
  }
  if (before == Stage::alive) {
    endpoint_->close(extensionHostError(ExtensionHostErrorCode::ended, "The process of " + identifier_ + " " + how + "."));
  }
  if (isExpected) {
    qxLog(log_, "[INFO] The process of %@ %@.", identifier_, how);
  } else {
    qxLog(log_, "[NOTICE] The process of %@ %@.", identifier_, how);
  }
  const std::lock_guard lock(eventMutex_);
  handlers_.onGone();
  return true;
}

void ExtensionProcess::graceIsOver() {
  const std::lock_guard lock(eventMutex_);
  if (stage_ == Stage::closed) {
    stage_ = Stage::terminated;
    signalPidfd(process_.descriptor, SIGTERM);
    graceTimer_->setFor(Clock::now() + times_.endGrace);
  } else if (stage_ == Stage::terminated) {
    stage_ = Stage::killed;
    endProcessTree(process_);
  }
}

void ExtensionProcess::lookForOverdueAnswers() {
  AnswerDeadlines::Verdict verdict;
  {
    const std::lock_guard lock(deadlinesMutex_);
    verdict = deadlines_.timerFired(Clock::now());
  }
  if (verdict.setTimer) answerTimer_->setFor(*verdict.setTimer);
  if (!verdict.overdue) return;
  const std::lock_guard lock(eventMutex_);
  if (stage_ != Stage::alive) return;
  stage_ = Stage::killed;
  qxLog(log_, "[NOTICE] The process of %@ did not answer %@ in time.", identifier_, *verdict.overdue);
  handlers_.onLost(ProcessLifetime::Cause::notAnswering);
  closeAndKill(extensionHostError(ExtensionHostErrorCode::notAnswering,
                                  "The process of " + identifier_ + " did not answer " + *verdict.overdue + " in time."));
}

void ExtensionProcess::watchLiveness() {
  if (!livenessTimerIsSet_.exchange(true)) livenessTimer_->setFor(Clock::now() + times_.livenessInterval);
}

// The timer counts as not set before it is known whether anything is expected: what comes after the look sets it.
void ExtensionProcess::askForSignOfLife() {
  livenessTimerIsSet_ = false;
  if (!handlers_.hasRequests() && !endpoint_->awaitsAnswers()) return;
  watchLiveness();
  if (pingIsUnanswered_.exchange(true)) return;
  const AnswerDeadlines::Message message = expectAnswer(AnswerLine::signsOfLife, "a ping");
  endpoint_->ping([weak = weak_from_this(), message] {
    const auto strongSelf = weak.lock();
    if (!strongSelf) return;
    strongSelf->gotAnswer(message);
    strongSelf->pingIsUnanswered_ = false;
  });
}

void ExtensionProcess::closeAndKill(const QXError& why) {
  // In this order, or the messages that wait may learn only that the peer has left.
  endpoint_->close(why);
  endProcessTree(process_);
}

AnswerDeadlines::Message ExtensionProcess::expectAnswer(AnswerLine line, const std::string& operationName) {
  AnswerDeadlines::Sent sent;
  {
    const std::lock_guard lock(deadlinesMutex_);
    sent = deadlines_.sent(line, operationName, Clock::now());
  }
  if (sent.setTimer) answerTimer_->setFor(*sent.setTimer);
  return sent.message;
}

void ExtensionProcess::gotAnswer(const AnswerDeadlines::Message& message) {
  const std::lock_guard lock(deadlinesMutex_);
  deadlines_.answered(message, Clock::now());
}

}  // namespace docuvend::linux_platform
