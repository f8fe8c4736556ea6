// Frames on their way to a socket that may not take them yet.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <vector>

#include "platform/linux/wire/Frame.h"

namespace docuvend::linux_platform {

class FrameWriter {
 public:
  // `tag` is the caller's name for the frame in `unwritten`.
  void add(EncodedFrame frame, std::uint64_t tag = 0);

  enum class Progress {
    drained,
    blocked,  // the socket takes no more for now
    broken,   // it never will
    refused,  // the system passes no descriptors on: too many of this user's lie in sockets unread
  };
  // Writes without waiting and without a signal.
  [[nodiscard]] Progress write(int socket);

  // Bytes that the socket has not taken.
  [[nodiscard]] std::size_t pendingBytes() const { return static_cast<std::size_t>(added_ - taken_); }
  // The stream's position behind the last frame that was added, and whether the socket has taken all before a position.
  [[nodiscard]] std::uint64_t position() const { return added_; }
  [[nodiscard]] bool isTaken(std::uint64_t position) const { return position <= taken_; }
  // The tags, other than 0, of the frames that the socket has not taken whole.
  [[nodiscard]] std::vector<std::uint64_t> unwritten() const;

 private:
  struct Waiting {
    EncodedFrame frame;
    std::uint64_t tag;
    std::size_t written = 0;
  };
  [[nodiscard]] static long writePart(int socket, const Waiting& waiting);

  std::deque<Waiting> queue_;
  std::uint64_t added_ = 0;  // bytes, since the beginning
  std::uint64_t taken_ = 0;
};

}  // namespace docuvend::linux_platform
