#include "platform/linux/wire/IncomingCalls.h"

#include <optional>
#include <string>
#include <utility>

#include "platform/linux/wire/Limits.h"
#include "platform/rpc_errors.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::size_t kMaximumQuotedName = 255;

QXError failure(QXRpcErrorCode code, std::string description) {
  return QXError::make(kQXRpcErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

std::string quote(const std::string& operation) {
  return operation.size() > kMaximumQuotedName ? "of " + std::to_string(operation.size()) + " bytes" : operation;
}

}  // namespace

// One request's right to be answered once.
struct IncomingCalls::Answer {
  Answer(std::weak_ptr<AnswerSink> to, std::uint64_t id, std::shared_ptr<const QXRpcInterface> exported, std::size_t index,
         std::shared_ptr<std::atomic<std::size_t>> count)
      : sink(std::move(to)), callID(id), interface(std::move(exported)), operation(index), unanswered(std::move(count)) {
    ++*unanswered;
  }
  Answer(const Answer&) = delete;
  Answer& operator=(const Answer&) = delete;
  ~Answer() {
    if (!given.exchange(true)) --*unanswered;
  }

  void give(QXArray values) {
    if (given.exchange(true)) return;
    --*unanswered;
    const auto open = sink.lock();
    if (!open) return;
    if (auto mismatch = qxReplyMismatch(*interface, operation, values)) {
      open->sendFailure({callID, failure(QXRpcErrorCode::invalidReply, *std::move(mismatch))});
    } else {
      open->sendReply({callID, std::move(values)});
    }
  }

  const std::weak_ptr<AnswerSink> sink;
  const std::uint64_t callID;
  const std::shared_ptr<const QXRpcInterface> interface;
  const std::size_t operation;
  const std::shared_ptr<std::atomic<std::size_t>> unanswered;
  std::atomic<bool> given = false;
};

void IncomingCalls::setInterface(QXRpcInterface interface) {
  const std::lock_guard lock(mutex_);
  interface_ = std::make_shared<const QXRpcInterface>(std::move(interface));
}

void IncomingCalls::setObject(std::shared_ptr<QXRpcExportedObject> object) {
  const std::lock_guard lock(mutex_);
  object_.swap(object);
}

void IncomingCalls::release() { setObject(nullptr); }

void IncomingCalls::run(RequestFrame request, const std::shared_ptr<AnswerSink>& sink) {
  std::shared_ptr<const QXRpcInterface> interface;
  std::shared_ptr<QXRpcExportedObject> object;
  {
    const std::lock_guard lock(mutex_);
    interface = interface_;
    object = object_;
  }
  const auto operation = interface && object ? interface->indexOf(request.operation) : std::nullopt;
  if (!operation) {
    sink->sendFailure({request.callID, failure(QXRpcErrorCode::unknownOperation, "unknown operation " + quote(request.operation))});
    return;
  }
  if (auto mismatch = qxMismatch(interface->operations()[*operation].arguments, request.arguments)) {
    sink->sendFailure({request.callID, failure(QXRpcErrorCode::invalidArguments, request.operation + ": " + *mismatch)});
    return;
  }
  QXRpcReply reply;
  if (request.wantsReply) {
    if (*unanswered_ >= kMaximumPendingCalls) {
      sink->sendFailure({request.callID, failure(QXRpcErrorCode::tooManyCalls, "too many requests wait for their answers")});
      return;
    }
    const auto answer = std::make_shared<Answer>(sink, request.callID, std::move(interface), *operation, unanswered_);
    reply = [answer](QXArray values) { answer->give(std::move(values)); };
  }
  object->invoke(*operation, std::move(request.arguments), std::move(reply));
}

}  // namespace docuvend::linux_platform
