// Takes bytes and descriptors from a socket and gives whole frames. Holds at most one frame and one reading beyond it.
#pragma once

#include <cstdint>
#include <deque>
#include <variant>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/Frame.h"

namespace docuvend::linux_platform {

class FrameReader {
 public:
  struct Got {};      // some bytes
  struct Nothing {};  // nothing for now
  struct Ended {};    // the peer will send no more
  struct Failed {
    int errnoValue = 0;
  };
  using Reading = std::variant<Got, Nothing, Ended, Failed, Malformed>;

  // Reads once, without waiting.
  [[nodiscard]] Reading read(int socket);

  struct Incomplete {};
  // The next whole frame. Call it until it is incomplete before reading again. After something malformed nothing more is to be read.
  [[nodiscard]] std::variant<Incomplete, Frame, Malformed> next();

  // Of the last frame that was given, with its length.
  [[nodiscard]] std::size_t frameBytes() const { return frameBytes_; }

  // True when the bytes so far end inside a frame.
  [[nodiscard]] bool insideFrame() const { return start_ < buffer_.size(); }

 private:
  [[nodiscard]] std::optional<Malformed> checkIncomplete() const;

  std::vector<std::uint8_t> buffer_;
  std::size_t start_ = 0;  // of the next frame in the buffer
  std::size_t frameBytes_ = 0;
  std::deque<UniqueDescriptor> descriptors_;
};

}  // namespace docuvend::linux_platform
