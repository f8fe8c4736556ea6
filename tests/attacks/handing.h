// Handing an open descriptor to another process, over a connected socket between the two.
#pragma once

#include <sys/socket.h>
#include <sys/uio.h>

#include <cstring>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::tests {

// One byte with room for one descriptor.
struct Letter {
  Letter() {
    message.msg_iov = &content;
    message.msg_iovlen = 1;
    message.msg_control = control;
    message.msg_controllen = sizeof(control);
  }
  Letter(const Letter&) = delete;
  Letter& operator=(const Letter&) = delete;

  char byte = 0;
  iovec content{&byte, sizeof(byte)};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
  msghdr message{};
};

// False with errno when it could not be sent.
inline bool handOver(int socket, int descriptor) {
  Letter letter;
  cmsghdr* header = CMSG_FIRSTHDR(&letter.message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(sizeof(int));
  std::memcpy(CMSG_DATA(header), &descriptor, sizeof(int));
  return ::sendmsg(socket, &letter.message, MSG_NOSIGNAL) == 1;
}

// None when the other side sent none, or is gone.
inline linux_platform::UniqueDescriptor takeOver(int socket) {
  Letter letter;
  if (::recvmsg(socket, &letter.message, MSG_CMSG_CLOEXEC) != 1) return {};
  const cmsghdr* header = CMSG_FIRSTHDR(&letter.message);
  if (header == nullptr || header->cmsg_type != SCM_RIGHTS) return {};
  int descriptor = -1;
  std::memcpy(&descriptor, CMSG_DATA(header), sizeof(int));
  return linux_platform::UniqueDescriptor(descriptor);
}

}  // namespace docuvend::tests
