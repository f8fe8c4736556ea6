#include "platform/linux/wire/IncomingCalls.h"

#include <algorithm>
#include <atomic>
#include <optional>
#include <string>
#include <utility>

#include "platform/linux/wire/Limits.h"
#include "platform/rpc_errors.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::size_t kMaximumQuotedName = 255;

std::string quote(const std::string& operation) {
  return operation.size() > kMaximumQuotedName ? "of " + std::to_string(operation.size()) + " bytes" : operation;
}

bool contains(const std::vector<std::string>& operations, const std::string& operation) {
  return std::find(operations.begin(), operations.end(), operation) != operations.end();
}

std::size_t descriptorsAmong(const std::vector<QXValueKind>& kinds) {
  return static_cast<std::size_t>(std::count(kinds.begin(), kinds.end(), QXValueKind::descriptor));
}

}  // namespace

// One request's right to be answered once.
struct IncomingCalls::Answer {
  Answer(std::weak_ptr<AnswerSink> to, std::uint64_t id, std::shared_ptr<const QXRpcInterface> exported, std::size_t index,
         std::unique_ptr<CallBudget::Share> taken, std::unique_ptr<UntakenDescriptors::Share> reserved)
      : sink(std::move(to)),
        callID(id),
        interface(std::move(exported)),
        operation(index),
        share(std::move(taken)),
        room(std::move(reserved)) {}
  Answer(const Answer&) = delete;
  Answer& operator=(const Answer&) = delete;
  ~Answer() {
    const auto open = sink.lock();
    if (room && open) open->release(std::move(room));
  }

  void give(QXArray values) {
    if (given.exchange(true)) return;
    share.reset();
    const auto open = sink.lock();
    if (!open) return;
    if (auto mismatch = qxReplyMismatch(*interface, operation, values)) {
      if (room) open->release(std::move(room));
      open->sendFailure({callID, qxRpcError(QXRpcErrorCode::invalidReply, *std::move(mismatch))});
    } else {
      open->sendReply({callID, std::move(values)}, std::move(room));
    }
  }

  const std::weak_ptr<AnswerSink> sink;  // empty: the peer wants no answer
  const std::uint64_t callID;
  const std::shared_ptr<const QXRpcInterface> interface;
  const std::size_t operation;
  std::atomic<bool> given = false;
  std::unique_ptr<CallBudget::Share> share;         // none of a releasing one; of whoever gives the answer, and of the destructor
  std::unique_ptr<UntakenDescriptors::Share> room;  // of the same; none where no descriptors are answered, or they are not counted
};

IncomingCalls::IncomingCalls(CallRules rules)
    : rules_(std::move(rules)), budget_(std::make_shared<CallBudget>(CallLimits{kMaximumPendingCalls, kMaximumCallBytes}, rules_.budget)) {}

void IncomingCalls::setInterface(QXRpcInterface interface) {
  const std::lock_guard lock(mutex_);
  interface_ = std::make_shared<const QXRpcInterface>(std::move(interface));
}

void IncomingCalls::setObject(std::shared_ptr<QXRpcExportedObject> object) {
  const std::lock_guard lock(mutex_);
  object_.swap(object);
}

void IncomingCalls::release() { setObject(nullptr); }

bool IncomingCalls::mayAskFor(const std::string& operation) const { return !rules_.operations || contains(*rules_.operations, operation); }

bool IncomingCalls::isReleasing(const std::string& operation) const { return contains(rules_.releasing, operation); }

void IncomingCalls::run(RequestFrame request, std::size_t bytes, const std::shared_ptr<AnswerSink>& sink) {
  if (!mayAskFor(request.operation)) {
    sink->sendFailure({request.callID, qxRpcError(QXRpcErrorCode::notPermitted, "the operation is not for a process without an identity")});
    return;
  }
  std::shared_ptr<const QXRpcInterface> interface;
  std::shared_ptr<QXRpcExportedObject> object;
  {
    const std::lock_guard lock(mutex_);
    interface = interface_;
    object = object_;
  }
  const auto operation = interface && object ? interface->indexOf(request.operation) : std::nullopt;
  if (!operation) {
    sink->sendFailure({request.callID, qxRpcError(QXRpcErrorCode::unknownOperation, "unknown operation " + quote(request.operation))});
    return;
  }
  if (auto mismatch = qxMismatch(interface->operations()[*operation].arguments, request.arguments)) {
    sink->sendFailure({request.callID, qxRpcError(QXRpcErrorCode::invalidArguments, request.operation + ": " + *mismatch)});
    return;
  }
  const bool takesNothing = isReleasing(request.operation);
  auto share = takesNothing ? nullptr : budget_->take(bytes);
  if (!share && !takesNothing) {
    sink->sendFailure({request.callID, qxRpcError(QXRpcErrorCode::tooManyCalls, "too many requests wait for their answers")});
    return;
  }
  const std::size_t descriptors = rules_.untaken && request.wantsReply ? descriptorsAmong(interface->operations()[*operation].replies) : 0;
  auto room = descriptors > 0 ? sink->reserve(descriptors) : nullptr;
  if (descriptors > 0 && !room) {
    sink->sendFailure({request.callID, qxRpcError(QXRpcErrorCode::tooManyCalls, "too many open files wait to be taken")});
    return;
  }
  // A request that wants no answer is as much work as one that does.
  const auto answer = std::make_shared<Answer>(request.wantsReply ? sink : nullptr, request.callID, std::move(interface), *operation,
                                               std::move(share), std::move(room));
  const LogSubject subject(rules_.subject);
  object->invoke(*operation, std::move(request.arguments), [answer](QXArray values) { answer->give(std::move(values)); });
}

}  // namespace docuvend::linux_platform
