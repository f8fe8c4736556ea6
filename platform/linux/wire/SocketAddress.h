// The address of a socket file, also where its path is longer than an address can hold.
#pragma once

#include <sys/socket.h>
#include <sys/un.h>

#include <string>
#include <variant>

#include "platform/QXError.h"
#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

class SocketAddress {
 public:
  // The path is absolute. A long one is reached through a descriptor of its directory, which is held as long as the address.
  [[nodiscard]] static std::variant<SocketAddress, QXError> forPath(const std::string& path);

  [[nodiscard]] const sockaddr* address() const { return reinterpret_cast<const sockaddr*>(&address_); }
  [[nodiscard]] socklen_t length() const { return length_; }

 private:
  SocketAddress() = default;
  [[nodiscard]] bool set(const std::string& path);

  UniqueDescriptor directory_;
  sockaddr_un address_{};
  socklen_t length_ = 0;
};

}  // namespace docuvend::linux_platform
