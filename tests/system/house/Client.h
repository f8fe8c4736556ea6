// A connection to one of the daemon's services, for operations with arguments that the consumer library would not send.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <variant>

#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/Reactor.h"
#include "sdk/BlockingCall.h"
#include "service/DVDaemon.h"
#include "tests/wire/Waiting.h"

namespace docuvend::tests {

class Client {
 public:
  // Throws when the service cannot be connected to.
  Client(const std::string& socketPath, std::optional<std::string> actAs);
  explicit Client(linux_platform::UniqueDescriptor socket, std::optional<std::string> actAs = std::nullopt);

  // An operation's reply values, or why it was not delivered. An argument may be std::nullopt.
  template <auto Method, class... Arguments>
  auto ask(Arguments&&... arguments) {
    auto outcome = sdk_detail::callAndWait<Method>(*endpoint_, {sdk_detail::after(kPatience)}, std::forward<Arguments>(arguments)...);
    using Answer = Result<sdk_detail::ReplyValues<Method>>;
    if (auto* values = std::get_if<sdk_detail::ReplyValues<Method>>(&outcome)) return Answer(std::move(*values));
    const auto* failure = std::get_if<sdk_detail::NotDelivered>(&outcome);
    return Answer(failure != nullptr ? failure->error : makeConsumerError(ConsumerErrorCode::deadlinePassed, "no answer to a test"));
  }

  [[nodiscard]] linux_platform::Endpoint& endpoint() { return *endpoint_; }

 private:
  linux_platform::Reactor reactor_{1};
  std::shared_ptr<linux_platform::Endpoint> endpoint_;
};

using sdk_detail::errorOf;

}  // namespace docuvend::tests
