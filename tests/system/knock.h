// Asks the administration at a socket for something, as any program could that finds the socket.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/Reactor.h"
#include "sdk/BlockingCall.h"
#include "service/DVAdministration.h"

namespace docuvend::tests {

template <auto Method, class... Arguments>
std::string knockFor(linux_platform::Endpoint& endpoint, const Arguments&... arguments) {
  const auto outcome = sdk_detail::callAndWait<Method>(endpoint, {sdk_detail::after(std::chrono::seconds(60))}, arguments...);
  if (const auto* failure = std::get_if<sdk_detail::NotDelivered>(&outcome)) {
    return failure->error.domain + " " + std::to_string(failure->error.code);
  }
  const auto* values = std::get_if<sdk_detail::ReplyValues<Method>>(&outcome);
  if (values == nullptr) return "no answer";
  const auto& error = std::get<std::optional<QXError>>(*values);
  return error ? error->domain + " " + std::to_string(error->code) : "answered";
}

// `request` is "status", "first-unlock", or "revoke" with a provider, an item and a consumer. The result is "answered", or the domain and
// code of the error; "not reached" and the same when nobody listens at the socket, or it is not there.
inline std::string knock(const std::string& socketPath, const std::vector<std::string>& request) {
  linux_platform::Reactor reactor(1);
  auto connected = linux_platform::connectToSocket(socketPath);
  if (const auto* error = std::get_if<QXError>(&connected)) return "not reached: " + error->domain + " " + std::to_string(error->code);
  const auto endpoint = linux_platform::Endpoint::create(reactor, std::get<linux_platform::UniqueDescriptor>(std::move(connected)), {}, {});
  endpoint->resume();
  if (request == std::vector<std::string>{"status"}) return knockFor<&DVAdministration::statusCompletionHandler>(*endpoint);
  if (request == std::vector<std::string>{"first-unlock"}) {
    return knockFor<&DVAdministration::announceFirstUnlockCompletionHandler>(*endpoint);
  }
  if (request.size() == 4 && request[0] == "revoke") {
    return knockFor<&DVAdministration::revokeItemID>(*endpoint, ItemID{request[2]}, ProviderID{request[1]}, ConsumerID{request[3]});
  }
  return "no such request";
}

}  // namespace docuvend::tests
