#include "platform/linux/rpc/ActivatedSockets.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <cstddef>
#include <cstdlib>
#include <optional>
#include <string_view>
#include <utility>

#include "platform/QXLogMessage.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kMaximumActivatedSockets = 64;

std::string takeVariable(const char* name) {
  const char* value = std::getenv(name);
  std::string text = value == nullptr ? "" : value;
  ::unsetenv(name);
  return text;
}

std::optional<int> number(std::string_view text) {
  int value = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (error != std::errc{} || end != text.data() + text.size()) return std::nullopt;
  return value;
}

bool hasOption(int descriptor, int option, int expected) {
  int value = 0;
  socklen_t size = sizeof value;
  return ::getsockopt(descriptor, SOL_SOCKET, option, &value, &size) == 0 && value == expected;
}

std::string boundPath(int descriptor) {
  sockaddr_un address{};
  socklen_t size = sizeof address;
  if (::getsockname(descriptor, reinterpret_cast<sockaddr*>(&address), &size) != 0) return {};
  if (size <= offsetof(sockaddr_un, sun_path)) return {};
  const std::string_view path(address.sun_path, size - offsetof(sockaddr_un, sun_path));
  return std::string(path.substr(0, path.find('\0')));
}

}  // namespace

std::vector<ActivatedSocket> takeActivatedSockets(QXLogHandle& log) {
  const auto process = number(takeVariable("LISTEN_PID"));
  const auto count = number(takeVariable("LISTEN_FDS"));
  std::string names = takeVariable("LISTEN_FDNAMES");
  std::vector<ActivatedSocket> sockets;
  if (process != ::getpid() || !count) return sockets;
  for (int i = 0; i < std::min(*count, kMaximumActivatedSockets); ++i) {
    const std::size_t colon = std::min(names.find(':'), names.size());
    std::string name = names.substr(0, colon);
    names.erase(0, colon + 1);

    UniqueDescriptor descriptor(kFirstActivatedDescriptor + i);
    if (::fcntl(descriptor.get(), F_SETFD, FD_CLOEXEC) != 0 || !hasOption(descriptor.get(), SO_DOMAIN, AF_UNIX) ||
        !hasOption(descriptor.get(), SO_TYPE, SOCK_STREAM) || !hasOption(descriptor.get(), SO_ACCEPTCONN, 1)) {
      qxLog(log, "[NOTICE] Ignoring the passed descriptor %d: it is no listening Unix stream socket.", descriptor.get());
      continue;
    }
    std::string path = boundPath(descriptor.get());
    sockets.push_back({std::move(name), std::move(path), std::move(descriptor)});
  }
  return sockets;
}

}  // namespace docuvend::linux_platform
