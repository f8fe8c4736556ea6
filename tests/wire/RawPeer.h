// A peer that writes and reads bytes by hand, with plain blocking calls.
#pragma once

#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/Frame.h"
#include "platform/linux/wire/Limits.h"

namespace docuvend::tests {

using linux_platform::UniqueDescriptor;

inline std::pair<UniqueDescriptor, UniqueDescriptor> socketPair() {
  std::array<int, 2> ends{-1, -1};
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) return {};
  return {UniqueDescriptor(ends[0]), UniqueDescriptor(ends[1])};
}

inline std::vector<std::uint8_t> bytesOf(const linux_platform::Frame& frame) {
  auto encoded = linux_platform::encodeFrame(frame);
  return std::get<linux_platform::EncodedFrame>(std::move(encoded)).bytes;
}

class RawPeer {
 public:
  explicit RawPeer(UniqueDescriptor socket) : socket_(std::move(socket)) {}

  [[nodiscard]] int socket() const { return socket_.get(); }
  void leave() { socket_.reset(); }

  // False when the other end has closed.
  bool write(std::span<const std::uint8_t> bytes, std::span<const int> descriptors = {}) const {
    alignas(cmsghdr) std::array<char, 1024> control{};
    std::size_t done = 0;
    while (done < bytes.size()) {
      iovec part{const_cast<std::uint8_t*>(bytes.data()) + done, bytes.size() - done};
      msghdr message{};
      message.msg_iov = &part;
      message.msg_iovlen = 1;
      if (done == 0 && !descriptors.empty()) {
        message.msg_control = control.data();
        message.msg_controllen = CMSG_SPACE(descriptors.size_bytes());
        cmsghdr* header = CMSG_FIRSTHDR(&message);
        header->cmsg_level = SOL_SOCKET;
        header->cmsg_type = SCM_RIGHTS;
        header->cmsg_len = CMSG_LEN(descriptors.size_bytes());
        std::memcpy(CMSG_DATA(header), descriptors.data(), descriptors.size_bytes());
      }
      const ssize_t count = ::sendmsg(socket_.get(), &message, MSG_NOSIGNAL);
      if (count < 0) return false;
      done += static_cast<std::size_t>(count);
    }
    return true;
  }
  bool write(const linux_platform::Frame& frame) const { return write(bytesOf(frame)); }
  bool sayHello() const { return write(linux_platform::Frame(linux_platform::Hello{linux_platform::kProtocolVersion, std::nullopt})); }

  // The next frame; none at the end of the connection. Frames with descriptors are not read here.
  std::optional<linux_platform::Frame> read() const {
    std::array<std::uint8_t, linux_platform::kFrameLengthBytes> length{};
    if (!readAll(length)) return std::nullopt;
    std::vector<std::uint8_t> contents(linux_platform::ByteReader(length).u32());
    if (!readAll(contents)) return std::nullopt;
    auto frame = linux_platform::decodeFrame(contents, {});
    if (auto* decoded = std::get_if<linux_platform::Frame>(&frame)) return std::move(*decoded);
    return std::nullopt;
  }
  // The next frame when it is of that type.
  template <class T>
  std::optional<T> read() const {
    auto frame = read();
    if (!frame) return std::nullopt;
    if (auto* typed = std::get_if<T>(&*frame)) return std::move(*typed);
    return std::nullopt;
  }
  // True when nothing but the end of the connection is left to read.
  bool atEnd() const {
    std::uint8_t byte = 0;
    return ::recv(socket_.get(), &byte, 1, 0) <= 0;
  }

 private:
  bool readAll(std::span<std::uint8_t> bytes) const {
    std::size_t done = 0;
    while (done < bytes.size()) {
      const ssize_t count = ::recv(socket_.get(), bytes.data() + done, bytes.size() - done, 0);
      if (count <= 0) return false;
      done += static_cast<std::size_t>(count);
    }
    return true;
  }

  UniqueDescriptor socket_;
};

}  // namespace docuvend::tests
