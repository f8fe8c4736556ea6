#include "sdk/ServiceConnections.h"

#include <cstdlib>

#include "platform/linux/wire/Limits.h"

namespace docuvend::sdk_detail {

using linux_platform::Endpoint;

Result<std::string> ServiceConnections::runtimeDirectory() {
  const char* runtime = std::getenv("XDG_RUNTIME_DIR");
  if (runtime == nullptr || runtime[0] != '/') {
    return makeConsumerError(ConsumerErrorCode::unreachable, "XDG_RUNTIME_DIR is not set to an absolute path.");
  }
  return std::string(runtime) + "/docuvend";
}

Failure ServiceConnections::reach(const std::string& service) {
  auto reached = endpoint(service);
  if (auto* error = std::get_if<QXError>(&reached)) return *error;
  return std::nullopt;
}

Result<std::shared_ptr<Endpoint>> ServiceConnections::endpoint(const std::string& service) {
  const std::lock_guard lock(mutex_);
  if (const auto found = open_.find(service); found != open_.end()) return found->second.endpoint;
  auto socket = linux_platform::connectToSocket(socketDirectory_ + "/" + service);
  if (auto* error = std::get_if<QXError>(&socket)) {
    QXError unreachable = makeConsumerError(ConsumerErrorCode::unreachable, "The Docuvend daemon cannot be reached.");
    unreachable.underlying = std::make_shared<const QXError>(*error);
    return unreachable;
  }
  Endpoint::Handlers handlers;
  // `this` is safe: the reactor has run its last handler before anything else of this object goes.
  handlers.onClose = [this, service, serial = ++lastSerial_](const QXError&) { drop(service, serial); };
  auto made = Endpoint::create(reactor_, std::get<linux_platform::UniqueDescriptor>(std::move(socket)),
                               {linux_platform::kProtocolVersion, actAs_}, std::move(handlers));
  made->resume();
  open_.emplace(service, Open{lastSerial_, made});
  return made;
}

// A connection that is over is made anew by the next call.
void ServiceConnections::drop(const std::string& service, std::uint64_t serial) {
  const std::lock_guard lock(mutex_);
  const auto found = open_.find(service);
  if (found != open_.end() && found->second.serial == serial) open_.erase(found);
}

}  // namespace docuvend::sdk_detail
