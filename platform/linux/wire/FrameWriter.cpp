#include "platform/linux/wire/FrameWriter.h"

#include <sys/socket.h>
#include <sys/uio.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <utility>

#include "platform/linux/wire/Limits.h"

namespace docuvend::linux_platform {

void FrameWriter::add(EncodedFrame frame, FrameLabel label, std::unique_ptr<UntakenDescriptors::Share> share) {
  if (isOver_) {
    if (label.request != 0) lost_.push_back(label.request);
    return;
  }
  added_ += frame.bytes.size();
  queue_.push_back({std::move(frame), label, std::move(share)});
}

// A frame's descriptors go with its first byte.
long FrameWriter::writePart(int socket, const Waiting& waiting) {
  alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int) * kMaximumDescriptors)> control{};
  const auto& bytes = waiting.frame.bytes;
  iovec part{const_cast<std::uint8_t*>(bytes.data()) + waiting.written, bytes.size() - waiting.written};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  const auto& descriptors = waiting.frame.descriptors;
  if (waiting.written == 0 && !descriptors.empty()) {
    message.msg_control = control.data();
    message.msg_controllen = CMSG_SPACE(sizeof(int) * descriptors.size());
    cmsghdr* header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(sizeof(int) * descriptors.size());
    for (std::size_t i = 0; i < descriptors.size(); ++i) {
      std::memcpy(CMSG_DATA(header) + i * sizeof(int), &descriptors[i].number, sizeof(int));
    }
  }
  long count = 0;
  do {
    count = ::sendmsg(socket, &message, MSG_DONTWAIT | MSG_NOSIGNAL);
  } while (count < 0 && errno == EINTR);
  return count;
}

FrameWriter::Progress FrameWriter::write(int socket) {
  if (isOver_) return Progress::over;
  while (!queue_.empty()) {
    Waiting& first = queue_.front();
    const long count = writePart(socket, first);
    if (count < 0) {
      if (errno == ETOOMANYREFS) return Progress::refused;
      if (errno == EAGAIN || errno == EWOULDBLOCK) return Progress::blocked;
      end();
      return Progress::over;
    }
    first.written += static_cast<std::size_t>(count);
    taken_ += static_cast<std::uint64_t>(count);
    if (first.share) std::exchange(first.share, nullptr)->setSent();
    if (first.written == first.frame.bytes.size()) queue_.pop_front();
  }
  return Progress::drained;
}

void FrameWriter::end() {
  lost_ = unwritten();
  queue_.clear();
  taken_ = added_;
  isOver_ = true;
}

FrameLabel FrameWriter::dropRefused() {
  const FrameLabel label = queue_.front().label;
  taken_ += queue_.front().frame.bytes.size();
  queue_.pop_front();
  return label;
}

std::vector<std::uint64_t> FrameWriter::unwritten() const {
  std::vector<std::uint64_t> requests = lost_;
  for (const Waiting& waiting : queue_) {
    if (waiting.label.request != 0) requests.push_back(waiting.label.request);
  }
  return requests;
}

}  // namespace docuvend::linux_platform
