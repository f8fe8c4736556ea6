#include "platform/linux/wire/ConnectToSocket.h"

#include <sys/socket.h>
#include <sys/time.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>

#include "platform/linux/wire/SocketAddress.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::int64_t kMicrosecondsPerSecond = 1'000'000;

}  // namespace

std::variant<UniqueDescriptor, QXError> connectToSocket(const std::string& path, std::optional<std::chrono::milliseconds> patience) {
  auto found = SocketAddress::forPath(path);
  if (auto* error = std::get_if<QXError>(&found)) return std::move(*error);
  const auto& address = std::get<SocketAddress>(found);
  UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!socket) return QXError::system(errno, "cannot create a socket");
  if (patience) {
    // Bounds connecting alone: an endpoint's writing never waits. A zero would be no bound.
    const auto microseconds = std::max<std::int64_t>(1, std::chrono::microseconds(*patience).count());
    const timeval bound{microseconds / kMicrosecondsPerSecond, microseconds % kMicrosecondsPerSecond};
    if (::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &bound, sizeof(bound)) != 0) {
      return QXError::system(errno, "cannot bound the wait for a connection");
    }
  }
  int result = 0;
  do {
    result = ::connect(socket.get(), address.address(), address.length());
  } while (result != 0 && errno == EINTR);
  if (result != 0) return QXError::system(errno, "cannot connect to " + path);
  return socket;
}

}  // namespace docuvend::linux_platform
