// What travels over a connection, as bytes and back. docs/protocol.md describes it.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <variant>
#include <vector>

#include "platform/QXValue.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/Bytes.h"

namespace docuvend::linux_platform {

// The first frame of each direction. Of a version that is not spoken here nothing but its number is read.
struct Hello {
  std::uint32_t version = 0;
  std::optional<std::string> declaredBundle;  // an unconfined client: the bundle that it acts for
};

// Identifiers of calls rise strictly in each direction, from 1.
struct RequestFrame {
  std::uint64_t callID = 0;
  bool wantsReply = false;
  std::string operation;
  QXArray arguments;
};

struct ReplyFrame {
  std::uint64_t callID = 0;
  QXArray values;
};

struct FailureFrame {
  std::uint64_t callID = 0;
  QXError error;
};

// The last frame: why its sender ends the connection.
struct EndFrame {
  QXError error;
};

// Asks whether the other end still reads.
struct PingFrame {};

// The answer to a ping.
struct PongFrame {};

using Frame = std::variant<Hello, RequestFrame, ReplyFrame, FailureFrame, EndFrame, PingFrame, PongFrame>;

inline constexpr std::size_t kFrameLengthBytes = 4;
inline constexpr std::size_t kFrameHeaderBytes = 6;  // length, type, number of descriptors

struct EncodedFrame {
  std::vector<std::uint8_t> bytes;  // with the length in front
  std::vector<QXDescriptor> descriptors;
};

// Fails for what the wire cannot carry.
[[nodiscard]] std::variant<EncodedFrame, Malformed> encodeFrame(const Frame& frame);

// `contents` is what follows the length.
[[nodiscard]] std::variant<Frame, Malformed> decodeFrame(std::span<const std::uint8_t> contents, std::vector<UniqueDescriptor> descriptors);

}  // namespace docuvend::linux_platform
