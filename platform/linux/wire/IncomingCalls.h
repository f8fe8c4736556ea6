// Gives the peer's requests to the exported object and its answers back.
//
// May be used from any thread; a request runs on the thread that gives it.
#pragma once

#include <cstddef>
#include <memory>
#include <mutex>

#include "platform/linux/wire/CallRules.h"
#include "platform/linux/wire/Frame.h"
#include "platform/linux/wire/UntakenDescriptors.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

// Where answers go. May be used from any thread.
class AnswerSink {
 public:
  AnswerSink() = default;
  AnswerSink(const AnswerSink&) = delete;
  AnswerSink& operator=(const AnswerSink&) = delete;
  virtual ~AnswerSink() = default;

  // Room for an answer with so many descriptors, of a peer for whom these are counted. None when there is no room.
  [[nodiscard]] virtual std::unique_ptr<UntakenDescriptors::Share> reserve(std::size_t descriptors) = 0;
  // When no such answer comes.
  virtual void release(std::unique_ptr<UntakenDescriptors::Share> room) = 0;
  // `room` is what was reserved for it, if anything.
  virtual void sendReply(ReplyFrame reply, std::unique_ptr<UntakenDescriptors::Share> room) = 0;
  virtual void sendFailure(FailureFrame failure) = 0;
};

class IncomingCalls {
 public:
  explicit IncomingCalls(CallRules rules);

  void setInterface(QXRpcInterface interface);
  void setObject(std::shared_ptr<QXRpcExportedObject> object);
  // Lets the exported object go; answers to requests that it still holds are dropped with their sink, and keep their share of the budget
  // until then: what was asked for is still at work.
  void release();

  // Runs the request, which came in that many bytes, or refuses it.
  void run(RequestFrame request, std::size_t bytes, const std::shared_ptr<AnswerSink>& sink);

 private:
  struct Answer;
  [[nodiscard]] bool mayAskFor(const std::string& operation) const;
  [[nodiscard]] bool isReleasing(const std::string& operation) const;

  std::mutex mutex_;  // guards the two below
  std::shared_ptr<const QXRpcInterface> interface_;
  std::shared_ptr<QXRpcExportedObject> object_;

  const CallRules rules_;
  // Within that of the rules. Of requests whose replies are not called and not dropped yet, wanted or not.
  const std::shared_ptr<CallBudget> budget_;
};

}  // namespace docuvend::linux_platform
