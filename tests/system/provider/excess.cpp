#include "tests/system/provider/excess.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/wire/Frame.h"
#include "platform/linux/wire/FrameWriter.h"
#include "platform/linux/wire/Limits.h"

namespace docuvend::tests {

using namespace linux_platform;

void allocateWithoutEnd() {
  constexpr std::size_t kPart = std::size_t{64} << 20U;
  std::vector<std::unique_ptr<char[]>> parts;
  for (;;) parts.emplace_back(new char[kPart]);
}

int forkWithoutEnd() {
  for (int count = 0;; ++count) {
    const pid_t child = ::fork();
    if (child < 0) return count;
    while (child == 0) ::pause();
  }
}

int hoardDescriptors() {
  constexpr int kEnough = 4096;
  rlimit limit{};
  ::getrlimit(RLIMIT_NOFILE, &limit);
  limit.rlim_cur = limit.rlim_max;
  ::setrlimit(RLIMIT_NOFILE, &limit);
  int count = 0;
  while (count < kEnough) {
    std::array<int, 2> ends{};
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends.data()) != 0) return count;
    FrameWriter writer;
    QXArray values;
    for (std::size_t i = 0; i < kMaximumDescriptors; ++i) values.emplace_back(QXDescriptor{ends[0], nullptr});
    while (true) {
      writer.add(std::get<EncodedFrame>(encodeFrame(ReplyFrame{1, values})));
      const auto progress = writer.write(ends[0]);
      if (progress == FrameWriter::Progress::blocked) break;         // this socket is full
      if (progress != FrameWriter::Progress::drained) return count;  // too many are on their way
      count += static_cast<int>(kMaximumDescriptors);
    }
  }
  return count;
}

void chatter(int lines) {
  for (int i = 0; i < lines; ++i) std::fputs("and another thing\n", stderr);
}

void floodWithFrames(int socket) {
  constexpr std::uint64_t kFramesBetweenDescriptors = 64;
  ::fcntl(socket, F_SETFL, O_NONBLOCK);
  const UniqueDescriptor nothing(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  const QXArray many(kMaximumDescriptors, QXValue(QXDescriptor{nothing.get(), nullptr}));
  FrameWriter writer;
  writer.add(std::get<EncodedFrame>(encodeFrame(Hello{kProtocolVersion, std::nullopt})));
  for (std::uint64_t number = 1;; ++number) {
    const bool carriesDescriptors = number % kFramesBetweenDescriptors == 0;
    writer.add(std::get<EncodedFrame>(encodeFrame(RequestFrame{number, true, "nothing:", carriesDescriptors ? many : QXArray{}})));
    auto progress = writer.write(socket);
    while (progress == FrameWriter::Progress::blocked) {
      pollfd ready{socket, POLLOUT, 0};
      ::poll(&ready, 1, -1);
      progress = writer.write(socket);
    }
    if (progress != FrameWriter::Progress::drained) return;
  }
}

}  // namespace docuvend::tests
