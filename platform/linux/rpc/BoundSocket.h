// A listening Unix stream socket with a name in a directory.
//
// The name appears with the socket already listening, and replaces a stale socket of this user in one step. Anything else that has the name
// is left alone and is an error: a file, a socket of another user, a socket that somebody listens to.
#pragma once

#include <sys/types.h>

#include <memory>
#include <string>
#include <variant>

#include "platform/QXError.h"
#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

// Connections that wait to be accepted, those of everybody: who comes next stands in line behind them, and each costs a look at its maker.
// Those for whom there is no room wait outside, and nobody's number of tries puts him in front.
inline constexpr int kMaximumWaitingConnections = 32;

class BoundSocket {
 public:
  // The path is absolute and may be longer than a socket address. Mode 600.
  [[nodiscard]] static std::variant<std::unique_ptr<BoundSocket>, QXError> create(const std::string& path);
  // Removes the name if it still is this socket's.
  ~BoundSocket();
  BoundSocket(const BoundSocket&) = delete;
  BoundSocket& operator=(const BoundSocket&) = delete;

  [[nodiscard]] int descriptor() const { return socket_.get(); }

 private:
  BoundSocket() = default;

  UniqueDescriptor socket_;
  UniqueDescriptor directory_;
  std::string name_;
  dev_t device_ = 0;
  ino_t inode_ = 0;
};

}  // namespace docuvend::linux_platform
