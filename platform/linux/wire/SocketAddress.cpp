#include "platform/linux/wire/SocketAddress.h"

#include <fcntl.h>

#include <cerrno>
#include <cstddef>
#include <cstring>
#include <utility>

namespace docuvend::linux_platform {

bool SocketAddress::set(const std::string& path) {
  if (path.size() >= sizeof address_.sun_path || path.find('\0') != std::string::npos) return false;
  address_.sun_family = AF_UNIX;
  std::memcpy(address_.sun_path, path.c_str(), path.size() + 1);
  length_ = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size() + 1);
  return true;
}

std::variant<SocketAddress, QXError> SocketAddress::forPath(const std::string& path) {
  if (path.empty() || path.front() != '/') return QXError::system(EINVAL, "a socket's path is not absolute");
  SocketAddress address;
  if (address.set(path)) return address;
  const std::size_t slash = path.rfind('/');
  const std::string directory = path.substr(0, slash + 1);
  address.directory_ = UniqueDescriptor(::open(directory.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!address.directory_) return QXError::system(errno, "cannot open " + directory);
  if (address.set("/proc/self/fd/" + std::to_string(address.directory_.get()) + path.substr(slash))) return address;
  return QXError::system(ENAMETOOLONG, path);
}

}  // namespace docuvend::linux_platform
