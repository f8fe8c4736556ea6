#include "platform/linux/rpc/BoundSocket.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <optional>
#include <utility>

#include "platform/linux/base/PassedDescriptors.h"
#include "platform/linux/wire/SocketAddress.h"

namespace docuvend::linux_platform {
namespace {

constexpr mode_t kOwnerOnly = 0600;

std::variant<UniqueDescriptor, QXError> newSocket() {
  UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!socket) return QXError::system(errno, "cannot create a socket");
  return socket;
}

// Why the name cannot be taken; none when there is nothing, or only a socket that nobody listens to.
std::optional<QXError> findObstacle(int directory, const std::string& name, const std::string& path) {
  struct stat status {};
  if (::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
    if (errno == ENOENT) return std::nullopt;
    return QXError::system(errno, "cannot examine " + path);
  }
  if (!S_ISSOCK(status.st_mode)) return QXError::system(EEXIST, path + " is not a socket");
  if (status.st_uid != ::geteuid()) return QXError::system(EEXIST, path + " belongs to another user");
  auto address = SocketAddress::forPath(path);
  if (auto* error = std::get_if<QXError>(&address)) return std::move(*error);
  auto probe = newSocket();
  if (auto* error = std::get_if<QXError>(&probe)) return std::move(*error);
  const auto& to = std::get<SocketAddress>(address);
  if (::connect(std::get<UniqueDescriptor>(probe).get(), to.address(), to.length()) == 0 || errno == EAGAIN) {
    return QXError::system(EADDRINUSE, "another process listens at " + path);
  }
  if (errno != ECONNREFUSED && errno != ENOENT) return QXError::system(errno, "cannot examine " + path);
  return std::nullopt;
}

}  // namespace

std::variant<std::unique_ptr<BoundSocket>, QXError> BoundSocket::create(const std::string& path) {
  std::unique_ptr<BoundSocket> bound(new BoundSocket);
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return QXError::system(EINVAL, "a socket's path is not absolute");
  const std::string directory = path.substr(0, slash + 1);
  bound->directory_ = UniqueDescriptor(::open(directory.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!bound->directory_) return QXError::system(errno, "cannot open " + directory);
  bound->name_ = path.substr(slash + 1);
  const int at = bound->directory_.get();
  if (auto obstacle = findObstacle(at, bound->name_, path)) return *std::move(obstacle);

  const std::string newName = "." + bound->name_ + ".new";
  if (auto obstacle = findObstacle(at, newName, directory + newName)) return *std::move(obstacle);
  ::unlinkat(at, newName.c_str(), 0);
  auto address = SocketAddress::forPath(directory + newName);
  if (auto* error = std::get_if<QXError>(&address)) return std::move(*error);
  auto socket = newSocket();
  if (auto* error = std::get_if<QXError>(&socket)) return std::move(*error);
  bound->socket_ = std::get<UniqueDescriptor>(std::move(socket));
  const auto& to = std::get<SocketAddress>(address);
  if (::bind(bound->socket_.get(), to.address(), to.length()) != 0) return QXError::system(errno, "cannot bind " + directory + newName);

  static_cast<void>(refusePassedDescriptors(bound->socket_.get()));  // as far as the kernel can: the start-up log says whether it does

  struct stat status {};
  std::optional<QXError> error;
  if (::fchmodat(at, newName.c_str(), kOwnerOnly, 0) != 0 || ::fstatat(at, newName.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0 ||
      ::listen(bound->socket_.get(), kMaximumWaitingConnections) != 0 || ::renameat(at, newName.c_str(), at, bound->name_.c_str()) != 0) {
    error = QXError::system(errno, "cannot publish " + path);
    ::unlinkat(at, newName.c_str(), 0);
    return *std::move(error);
  }
  bound->device_ = status.st_dev;
  bound->inode_ = status.st_ino;
  return bound;
}

BoundSocket::~BoundSocket() {
  struct stat status {};
  if (inode_ == 0 || ::fstatat(directory_.get(), name_.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) return;
  if (status.st_dev == device_ && status.st_ino == inode_) ::unlinkat(directory_.get(), name_.c_str(), 0);
}

}  // namespace docuvend::linux_platform
