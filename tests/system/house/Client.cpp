#include "tests/system/house/Client.h"

#include <stdexcept>

#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/Limits.h"

namespace docuvend::tests {

namespace {

linux_platform::UniqueDescriptor connected(const std::string& path) {
  auto socket = linux_platform::connectToSocket(path);
  if (const auto* error = std::get_if<QXError>(&socket)) throw std::runtime_error(error->description());
  return std::get<linux_platform::UniqueDescriptor>(std::move(socket));
}

}  // namespace

Client::Client(const std::string& socketPath, std::optional<std::string> actAs) : Client(connected(socketPath), std::move(actAs)) {}

Client::Client(linux_platform::UniqueDescriptor socket, std::optional<std::string> actAs)
    : endpoint_(linux_platform::Endpoint::create(reactor_, std::move(socket), {linux_platform::kProtocolVersion, std::move(actAs)}, {})) {
  endpoint_->resume();
}

}  // namespace docuvend::tests
