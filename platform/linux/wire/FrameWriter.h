// Frames on their way to a socket that may not take them yet.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <vector>

#include "platform/linux/wire/Frame.h"
#include "platform/linux/wire/UntakenDescriptors.h"

namespace docuvend::linux_platform {

// What becomes of a frame concerns the one whose number is here. Numbers begin at 1.
struct FrameLabel {
  std::uint64_t request = 0;   // the frame is this request
  std::uint64_t answerTo = 0;  // it answers that one
};

class FrameWriter {
 public:
  // `share` is that of the frame's descriptors, where they are counted. Once it is over, nothing is kept of a frame but which request it
  // was.
  void add(EncodedFrame frame, FrameLabel label = {}, std::unique_ptr<UntakenDescriptors::Share> share = {});

  enum class Progress {
    drained,
    blocked,  // the socket takes no more for now
    over,     // it never will: what waited is dropped
    refused,  // the system passes the next frame's descriptors on to nobody: too many of this user's lie in sockets unread
  };
  // Writes without waiting and without a signal.
  [[nodiscard]] Progress write(int socket);
  // Takes out the frame that was refused just now, of which nothing has been written.
  FrameLabel dropRefused();

  [[nodiscard]] bool isOver() const { return isOver_; }
  // Bytes that the socket has not taken.
  [[nodiscard]] std::size_t pendingBytes() const { return static_cast<std::size_t>(added_ - taken_); }
  // The stream's position behind the last frame that was added, and whether the socket has taken all before a position.
  [[nodiscard]] std::uint64_t position() const { return added_; }
  [[nodiscard]] bool isTaken(std::uint64_t position) const { return position <= taken_; }
  // The requests that the socket has not taken whole.
  [[nodiscard]] std::vector<std::uint64_t> unwritten() const;

 private:
  struct Waiting {
    EncodedFrame frame;
    FrameLabel label;
    std::unique_ptr<UntakenDescriptors::Share> share;
    std::size_t written = 0;
  };
  [[nodiscard]] static long writePart(int socket, const Waiting& waiting);
  void end();

  std::deque<Waiting> queue_;
  std::uint64_t added_ = 0;  // bytes, since the beginning
  std::uint64_t taken_ = 0;
  bool isOver_ = false;
  std::vector<std::uint64_t> lost_;  // requests that were to be written when it was over, or later
};

}  // namespace docuvend::linux_platform
