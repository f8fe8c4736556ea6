#include "platform/linux/wire/Frame.h"

#include <utility>

#include "platform/linux/wire/Limits.h"
#include "platform/linux/wire/ValueCodec.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::size_t kDescriptorCountPosition = 5;

enum class FrameType : std::uint8_t { hello = 1, request = 2, reply = 3, failure = 4, end = 5, ping = 6, pong = 7 };

struct BodyWriter {
  ByteWriter& bytes;
  ValueWriter& values;

  FrameType operator()(const Hello& hello) const {
    bytes.u32(hello.version);
    bytes.u8(hello.declaredBundle ? 1 : 0);
    if (hello.declaredBundle) bytes.text(*hello.declaredBundle);
    return FrameType::hello;
  }
  FrameType operator()(const RequestFrame& request) const {
    bytes.u64(request.callID);
    bytes.u8(request.wantsReply ? 1 : 0);
    bytes.text(request.operation);
    values.values(request.arguments);
    return FrameType::request;
  }
  FrameType operator()(const ReplyFrame& reply) const {
    bytes.u64(reply.callID);
    values.values(reply.values);
    return FrameType::reply;
  }
  FrameType operator()(const FailureFrame& failure) const {
    bytes.u64(failure.callID);
    values.error(failure.error);
    return FrameType::failure;
  }
  FrameType operator()(const EndFrame& end) const {
    values.error(end.error);
    return FrameType::end;
  }
  FrameType operator()(const PingFrame&) const { return FrameType::ping; }
  FrameType operator()(const PongFrame&) const { return FrameType::pong; }
};

std::optional<Frame> readBody(std::uint8_t type, ByteReader& bytes, ValueReader& values) {
  switch (type) {
    case static_cast<std::uint8_t>(FrameType::hello): {
      Hello hello{bytes.u32(), std::nullopt};
      if (hello.version != kProtocolVersion) {
        bytes.raw(bytes.remaining());
      } else if (bytes.flag("a mark of a declared bundle")) {
        hello.declaredBundle = bytes.text();
      }
      return hello;
    }
    case static_cast<std::uint8_t>(FrameType::request): {
      RequestFrame request;
      request.callID = bytes.u64();
      request.wantsReply = bytes.flag("a mark of a wanted reply");
      request.operation = bytes.text();
      request.arguments = values.values();
      return request;
    }
    case static_cast<std::uint8_t>(FrameType::reply): {
      const std::uint64_t callID = bytes.u64();
      return ReplyFrame{callID, values.values()};
    }
    case static_cast<std::uint8_t>(FrameType::failure): {
      const std::uint64_t callID = bytes.u64();
      return FailureFrame{callID, values.error()};
    }
    case static_cast<std::uint8_t>(FrameType::end):
      return EndFrame{values.error()};
    case static_cast<std::uint8_t>(FrameType::ping):
      return PingFrame{};
    case static_cast<std::uint8_t>(FrameType::pong):
      return PongFrame{};
    default:
      bytes.fail("a frame of unknown type " + std::to_string(type));
      return std::nullopt;
  }
}

}  // namespace

std::variant<EncodedFrame, Malformed> encodeFrame(const Frame& frame) {
  ByteWriter bytes;
  ValueWriter values(bytes);
  bytes.u32(0);
  const std::size_t typePosition = kFrameLengthBytes;
  bytes.u8(0);
  bytes.u8(0);
  const FrameType type = std::visit(BodyWriter{bytes, values}, frame);
  const std::size_t contents = bytes.bytes().size() - kFrameLengthBytes;
  if (contents > kMaximumFrameBytes) bytes.fail("a message of " + std::to_string(contents) + " bytes");
  if (bytes.failure()) return *bytes.failure();
  bytes.setU32At(0, static_cast<std::uint32_t>(contents));
  EncodedFrame encoded{bytes.take(), values.takeDescriptors()};
  encoded.bytes[typePosition] = static_cast<std::uint8_t>(type);
  encoded.bytes[kDescriptorCountPosition] = static_cast<std::uint8_t>(encoded.descriptors.size());
  return encoded;
}

std::variant<Frame, Malformed> decodeFrame(std::span<const std::uint8_t> contents, std::vector<UniqueDescriptor> descriptors) {
  ByteReader bytes(contents);
  const std::uint8_t type = bytes.u8();
  if (bytes.u8() != descriptors.size()) bytes.fail("a frame without the descriptors that it declares");
  ValueReader values(bytes, std::move(descriptors));
  std::optional<Frame> frame;
  if (bytes.ok()) frame = readBody(type, bytes, values);
  if (bytes.ok()) values.finish();
  if (bytes.failure()) return *bytes.failure();
  return *std::move(frame);
}

}  // namespace docuvend::linux_platform
