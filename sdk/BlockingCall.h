// Turns one asynchronous operation of a protocol into a call that waits.
#pragma once

#include <chrono>
#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <tuple>
#include <utility>
#include <variant>

#include "platform/linux/wire/Endpoint.h"
#include "platform/rpc_protocol.h"
#include "sdk/ConsumerErrors.h"
#include "sdk/Result.h"

namespace docuvend::sdk_detail {

template <class Completion>
struct AnswerOf;
template <class... Replies>
struct AnswerOf<std::function<void(std::optional<Replies>...)>> {
  using Values = std::tuple<std::optional<Replies>...>;
  using Promise = std::promise<Result<Values>>;

  static std::function<void(std::optional<Replies>...)> fulfil(std::shared_ptr<Promise> promise) {
    return [promise](std::optional<Replies>... replies) { promise->set_value(Values(std::move(replies)...)); };
  }
};

// The values of an operation's reply.
template <auto Method>
using ReplyValues = typename AnswerOf<typename rpc_detail::Traits<Method>::CompletionType>::Values;

// Sends `Method` over the endpoint and waits for its reply's values, for the delivery's failure, or for the deadline. The endpoint's
// reactor must not be waiting for the calling thread.
template <class Protocol, auto Method, class... Arguments>
[[nodiscard]] Result<ReplyValues<Method>> callAndWait(linux_platform::Endpoint& endpoint, std::chrono::milliseconds deadline,
                                                      Arguments&&... arguments) {
  using Answer = AnswerOf<typename rpc_detail::Traits<Method>::CompletionType>;
  auto promise = std::make_shared<typename Answer::Promise>();
  auto answer = promise->get_future();
  const QXRemote<Protocol> remote(endpoint.remoteObjectProxy([promise](const QXError& error) { promise->set_value(error); }));
  remote.template call<Method>(std::forward<Arguments>(arguments)..., Answer::fulfil(promise));
  if (answer.wait_for(deadline) != std::future_status::ready) {
    return makeConsumerError(ConsumerErrorCode::deadlinePassed, "No answer came in time.");
  }
  return answer.get();
}

}  // namespace docuvend::sdk_detail
