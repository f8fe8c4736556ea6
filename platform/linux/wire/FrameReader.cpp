#include "platform/linux/wire/FrameReader.h"

#include <sys/socket.h>
#include <sys/uio.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <utility>

#include "platform/linux/wire/Limits.h"

// Descriptors and bytes.
//
// The kernel hands descriptors out with the bytes that they were sent with, one sender's set per reading, but it does not say at which
// byte they were attached. So they wait in line, and a whole frame takes as many as it declares. What cannot belong to anything is found
// when no whole frame is left: then those in line may be no more than the frame that has begun declares. A frame that has not shown its
// head yet may declare up to the limit. Every descriptor in line closes itself: with a malformed frame, and with the connection.

namespace docuvend::linux_platform {
namespace {

constexpr std::size_t kDescriptorCountOffset = 5;

std::size_t lengthAt(const std::vector<std::uint8_t>& buffer, std::size_t position) {
  return ByteReader(std::span(buffer).subspan(position, kFrameLengthBytes)).u32();
}

// Takes ownership of every descriptor in the control message, whatever is wrong with it.
void takeDescriptors(const msghdr& message, std::deque<UniqueDescriptor>& into) {
  for (const cmsghdr* header = CMSG_FIRSTHDR(&message); header != nullptr;
       header = CMSG_NXTHDR(const_cast<msghdr*>(&message), const_cast<cmsghdr*>(header))) {
    if (header->cmsg_level != SOL_SOCKET || header->cmsg_type != SCM_RIGHTS) continue;
    const std::size_t count = (header->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t i = 0; i < count; ++i) {
      int number = -1;
      std::memcpy(&number, CMSG_DATA(header) + i * sizeof(int), sizeof number);
      into.emplace_back(number);
    }
  }
}

}  // namespace

FrameReader::Reading FrameReader::read(int socket) {
  if (start_ > 0) {
    buffer_.erase(buffer_.begin(), buffer_.begin() + static_cast<std::ptrdiff_t>(start_));
    start_ = 0;
    if (buffer_.empty() && buffer_.capacity() > 2 * kReadBytes) buffer_ = {};  // a long frame's memory is given back
  }
  std::array<std::uint8_t, kReadBytes> bytes;
  alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int) * kMaximumDescriptors)> control;
  iovec part{bytes.data(), bytes.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.data();
  message.msg_controllen = control.size();
  ssize_t count = 0;
  do {
    count = ::recvmsg(socket, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  } while (count < 0 && errno == EINTR);
  if (count < 0) {
    if (errno == EAGAIN || errno == EWOULDBLOCK) return Nothing{};
    return Failed{errno};
  }
  takeDescriptors(message, descriptors_);
  if ((static_cast<unsigned>(message.msg_flags) & static_cast<unsigned>(MSG_CTRUNC)) != 0) return Malformed{"too many descriptors"};
  if (count == 0) return Ended{};
  buffer_.insert(buffer_.end(), bytes.begin(), bytes.begin() + count);
  return Got{};
}

std::optional<Malformed> FrameReader::checkIncomplete() const {
  const std::size_t held = buffer_.size() - start_;
  std::size_t allowed = held == 0 ? 0 : kMaximumDescriptors;
  if (held >= kFrameHeaderBytes) allowed = buffer_[start_ + kDescriptorCountOffset];
  if (descriptors_.size() > allowed) return Malformed{"descriptors that no frame declares"};
  return std::nullopt;
}

std::variant<FrameReader::Incomplete, Frame, Malformed> FrameReader::next() {
  const std::size_t held = buffer_.size() - start_;
  if (held >= kFrameLengthBytes) {
    const std::size_t length = lengthAt(buffer_, start_);
    if (length > kMaximumFrameBytes) return Malformed{"a frame of " + std::to_string(length) + " bytes"};
    if (length < kFrameHeaderBytes - kFrameLengthBytes) return Malformed{"a frame without a head"};
    if (held >= kFrameLengthBytes + length) {
      const auto contents = std::span<const std::uint8_t>(buffer_).subspan(start_ + kFrameLengthBytes, length);
      const std::size_t declared = buffer_[start_ + kDescriptorCountOffset];
      std::vector<UniqueDescriptor> descriptors;
      while (descriptors.size() < declared && !descriptors_.empty()) {
        descriptors.push_back(std::move(descriptors_.front()));
        descriptors_.pop_front();
      }
      auto decoded = decodeFrame(contents, std::move(descriptors));
      frameBytes_ = kFrameLengthBytes + length;
      start_ += frameBytes_;
      if (auto* malformed = std::get_if<Malformed>(&decoded)) return std::move(*malformed);
      return std::get<Frame>(std::move(decoded));
    }
  }
  if (auto malformed = checkIncomplete()) return *std::move(malformed);
  return Incomplete{};
}

}  // namespace docuvend::linux_platform
