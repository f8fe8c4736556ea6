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
    using Protocol = typename rpc_detail::Traits<Method>::ProtocolType;
    return sdk_detail::callAndWait<Protocol, Method>(*endpoint_, kPatience, std::forward<Arguments>(arguments)...);
  }

  [[nodiscard]] linux_platform::Endpoint& endpoint() { return *endpoint_; }

 private:
  linux_platform::Reactor reactor_{1};
  std::shared_ptr<linux_platform::Endpoint> endpoint_;
};

// The one value of a reply: its error. A delivery that failed counts as its error.
template <class Values>
std::optional<QXError> errorOf(const Result<Values>& answer) {
  if (const auto* undelivered = std::get_if<QXError>(&answer)) return *undelivered;
  return std::get<std::optional<QXError>>(std::get<Values>(answer));
}

}  // namespace docuvend::tests
