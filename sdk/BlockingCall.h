// Turns one asynchronous operation of a protocol into a call that waits.
#pragma once

#include <algorithm>
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

using TimePoint = std::chrono::steady_clock::time_point;

// That long from now; what is longer than a year is a year.
[[nodiscard]] inline TimePoint after(std::chrono::milliseconds time) {
  static constexpr std::chrono::hours kYear{24 * 365};
  return std::chrono::steady_clock::now() + std::min<std::chrono::milliseconds>(time, kYear);
}

// Never negative.
[[nodiscard]] inline std::chrono::milliseconds timeLeft(TimePoint until) {
  return std::max(std::chrono::milliseconds(0), std::chrono::ceil<std::chrono::milliseconds>(until - std::chrono::steady_clock::now()));
}

// How a call waits.
struct Waiting {
  TimePoint until;
  // Run on the calling thread each time `interval` has passed. May be empty.
  std::function<void()> meanwhile = {};
  std::chrono::milliseconds interval{0};
  // Kept until the call is answered or can be answered no more, also when the caller has stopped waiting.
  std::shared_ptr<const void> held = {};
};

struct NotDelivered {
  QXError error;
  linux_platform::MessageFate fate;
};
struct NotInTime {};

// A call that nobody has settled yet; it is settled once. What it holds goes before the caller knows, so that the caller's own is the last.
template <class Outcome>
class PendingCall {
 public:
  explicit PendingCall(std::shared_ptr<const void> held) : held_(std::move(held)) {}

  [[nodiscard]] std::future<Outcome> outcome() { return promise_.get_future(); }
  void settle(Outcome outcome) {
    held_.reset();
    promise_.set_value(std::move(outcome));
  }

 private:
  std::promise<Outcome> promise_;
  std::shared_ptr<const void> held_;
};

template <class Completion>
struct AnswerOf;
template <class... Replies>
struct AnswerOf<std::function<void(std::optional<Replies>...)>> {
  using Values = std::tuple<std::optional<Replies>...>;
  using Outcome = std::variant<Values, NotDelivered, NotInTime>;

  static std::function<void(std::optional<Replies>...)> settle(std::shared_ptr<PendingCall<Outcome>> call) {
    return [call = std::move(call)](std::optional<Replies>... replies) { call->settle(Values(std::move(replies)...)); };
  }
};

// The values of an operation's reply.
template <auto Method>
using ReplyValues = typename AnswerOf<typename rpc_detail::Traits<Method>::CompletionType>::Values;
template <auto Method>
using Outcome = typename AnswerOf<typename rpc_detail::Traits<Method>::CompletionType>::Outcome;

// Sends `Method` over the endpoint and waits for its reply's values, for the delivery's failure, or for the deadline. An answer that comes
// later is dropped. The endpoint's reactor must not be waiting for the calling thread.
template <auto Method, class... Arguments>
[[nodiscard]] Outcome<Method> callAndWait(linux_platform::Endpoint& endpoint, const Waiting& waiting, Arguments&&... arguments) {
  using Traits = rpc_detail::Traits<Method>;
  const auto call = std::make_shared<PendingCall<Outcome<Method>>>(waiting.held);
  auto answer = call->outcome();
  const QXRemote<typename Traits::ProtocolType> remote(
      endpoint.remoteObjectProxy([call](const QXError& error, linux_platform::MessageFate fate) {
        call->settle(NotDelivered{error, fate});
      }));
  remote.template call<Method>(std::forward<Arguments>(arguments)..., AnswerOf<typename Traits::CompletionType>::settle(call));
  for (;;) {
    const TimePoint wakeUp = waiting.meanwhile ? std::min(waiting.until, after(waiting.interval)) : waiting.until;
    if (answer.wait_until(wakeUp) == std::future_status::ready) return answer.get();
    if (std::chrono::steady_clock::now() >= waiting.until) return NotInTime{};
    if (waiting.meanwhile) waiting.meanwhile();
  }
}

// Why the operation failed, if it did: in its delivery, or as its reply says.
template <class Values>
[[nodiscard]] Failure errorOf(const Result<Values>& answer) {
  if (const auto* undelivered = std::get_if<QXError>(&answer)) return *undelivered;
  if constexpr (std::tuple_size_v<Values> == 0) {
    return std::nullopt;
  } else {
    return std::get<std::optional<QXError>>(std::get<Values>(answer));
  }
}

// The reply's one value of that type. `what` names it for a person who reads of its absence.
template <class T, class Values>
[[nodiscard]] Result<T> valueOf(Result<Values> answer, const char* what) {
  if (auto error = errorOf(answer)) return *std::move(error);
  auto& value = std::get<std::optional<T>>(std::get<Values>(answer));
  if (!value) return makeConsumerError(ConsumerErrorCode::noAnswer, std::string("The answer carries neither ") + what + " nor an error.");
  return *std::move(value);
}

}  // namespace docuvend::sdk_detail
