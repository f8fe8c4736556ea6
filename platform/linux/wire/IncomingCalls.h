// Gives the peer's requests to the exported object and its answers back.
//
// May be used from any thread; a request runs on the thread that gives it.
#pragma once

#include <atomic>
#include <cstddef>
#include <memory>
#include <mutex>

#include "platform/linux/wire/Frame.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

// Where answers go. May be used from any thread.
class AnswerSink {
 public:
  AnswerSink() = default;
  AnswerSink(const AnswerSink&) = delete;
  AnswerSink& operator=(const AnswerSink&) = delete;
  virtual ~AnswerSink() = default;

  virtual void sendReply(ReplyFrame reply) = 0;
  virtual void sendFailure(FailureFrame failure) = 0;
};

class IncomingCalls {
 public:
  void setInterface(QXRpcInterface interface);
  void setObject(std::shared_ptr<QXRpcExportedObject> object);
  // Lets the exported object go; answers to requests that it still holds are dropped with their sink.
  void release();

  // Runs the request, or refuses it.
  void run(RequestFrame request, const std::shared_ptr<AnswerSink>& sink);

 private:
  struct Answer;

  std::mutex mutex_;  // guards the two below
  std::shared_ptr<const QXRpcInterface> interface_;
  std::shared_ptr<QXRpcExportedObject> object_;

  // Requests whose replies are not answered and not dropped yet; the answers share it, for they may live longer.
  const std::shared_ptr<std::atomic<std::size_t>> unanswered_ = std::make_shared<std::atomic<std::size_t>>(0);
};

}  // namespace docuvend::linux_platform
