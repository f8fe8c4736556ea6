#include "platform/linux/wire/SendBuffer.h"

#include <sys/socket.h>

#include <utility>

namespace docuvend::linux_platform {
namespace {

constexpr int kNarrowest = 1;  // the system makes its least of it

void set(int socket, int bytes) { static_cast<void>(::setsockopt(socket, SOL_SOCKET, SO_SNDBUF, &bytes, sizeof bytes)); }

}  // namespace

void SendBuffer::narrow(int socket) {
  if (usual_ != 0) return;
  socklen_t size = sizeof usual_;
  if (::getsockopt(socket, SOL_SOCKET, SO_SNDBUF, &usual_, &size) == 0) set(socket, kNarrowest);
}

// What is set the system doubles, and tells doubled.
void SendBuffer::widen(int socket) {
  if (usual_ != 0) set(socket, std::exchange(usual_, 0) / 2);
}

}  // namespace docuvend::linux_platform
