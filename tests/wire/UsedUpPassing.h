// As long as it lives the system passes no further open file on for this user: as many as it may lie unread in a socket of this process.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <utility>
#include <variant>

#include "platform/linux/wire/FrameWriter.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::tests {

class UsedUpPassing {
 public:
  UsedUpPassing() : sockets_(socketPair()) {
    EXPECT_EQ(::getrlimit(RLIMIT_NOFILE, &usual_), 0);
    const rlimit tight{64, usual_.rlim_max};
    EXPECT_EQ(::setrlimit(RLIMIT_NOFILE, &tight), 0);
    linux_platform::FrameWriter filler;
    auto progress = linux_platform::FrameWriter::Progress::drained;
    for (int i = 0; i < 200 && progress == linux_platform::FrameWriter::Progress::drained; ++i) {
      linux_platform::UniqueDescriptor nothing(::open("/dev/null", O_RDONLY | O_CLOEXEC));
      filler.add(std::get<linux_platform::EncodedFrame>(
          linux_platform::encodeFrame(linux_platform::ReplyFrame{1, {QXValue(linux_platform::toValue(std::move(nothing)))}})));
      progress = filler.write(sockets_.first.get());
    }
    EXPECT_EQ(progress, linux_platform::FrameWriter::Progress::refused);
  }
  UsedUpPassing(const UsedUpPassing&) = delete;
  UsedUpPassing& operator=(const UsedUpPassing&) = delete;
  ~UsedUpPassing() { EXPECT_EQ(::setrlimit(RLIMIT_NOFILE, &usual_), 0); }

 private:
  std::pair<linux_platform::UniqueDescriptor, linux_platform::UniqueDescriptor> sockets_;
  rlimit usual_{};
};

}  // namespace docuvend::tests
