// A peer that takes frames with descriptors, and closes them, when the test says so.
#pragma once

#include <poll.h>
#include <sys/socket.h>

#include <array>
#include <chrono>
#include <cstdint>
#include <optional>
#include <utility>
#include <variant>

#include "platform/linux/wire/FrameReader.h"
#include "tests/wire/RawPeer.h"
#include "tests/wire/Waiting.h"

namespace docuvend::tests {

class TakingPeer : public RawPeer {
 public:
  using RawPeer::RawPeer;

  // The next frame; none at the end of the connection, or when none comes.
  std::optional<linux_platform::Frame> take() {
    using Reader = linux_platform::FrameReader;
    while (true) {
      auto next = reader_.next();
      if (auto* frame = std::get_if<linux_platform::Frame>(&next)) return std::move(*frame);
      if (!std::holds_alternative<Reader::Incomplete>(next)) return std::nullopt;
      pollfd waiting{socket(), POLLIN, 0};
      if (::poll(&waiting, 1, static_cast<int>(std::chrono::milliseconds(kPatience).count())) <= 0) return std::nullopt;
      const auto reading = reader_.read(socket());
      if (!std::holds_alternative<Reader::Got>(reading) && !std::holds_alternative<Reader::Nothing>(reading)) return std::nullopt;
    }
  }
  template <class T>
  std::optional<T> take() {
    auto frame = take();
    if (!frame) return std::nullopt;
    if (auto* typed = std::get_if<T>(&*frame)) return std::move(*typed);
    return std::nullopt;
  }
  // What was sent at once and no more, which the system does not read together with other descriptors: its bytes, and lets its descriptors
  // go.
  bool takeOneMessage() const {
    std::array<std::uint8_t, 4096> bytes{};
    return ::recv(socket(), bytes.data(), bytes.size(), 0) > 0;
  }

 private:
  linux_platform::FrameReader reader_;
};

}  // namespace docuvend::tests
