// Values as bytes, and back. docs/protocol.md describes the encoding.
#pragma once

#include <cstddef>
#include <span>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/QXValue.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/Bytes.h"

namespace docuvend::linux_platform {

// Writes the values of one frame. Descriptors are only allowed at the top level; they are collected beside the bytes.
class ValueWriter {
 public:
  explicit ValueWriter(ByteWriter& bytes) : bytes_(bytes) {}

  void values(const QXArray& values);
  void value(const QXValue& value);
  void error(const QXError& error);

  [[nodiscard]] std::vector<QXDescriptor> takeDescriptors() { return std::move(descriptors_); }

 private:
  struct Visitor;
  void countElement();
  bool enter();
  void leave() { --depth_; }
  void url(const QXURL& url);

  ByteWriter& bytes_;
  std::vector<QXDescriptor> descriptors_;
  std::size_t depth_ = 0;
  std::size_t elements_ = 0;
};

// Reads the values of one frame. Every descriptor that came with the frame must be used by a value; those that are not are closed.
class ValueReader {
 public:
  ValueReader(ByteReader& bytes, std::vector<UniqueDescriptor> descriptors) : bytes_(bytes), descriptors_(std::move(descriptors)) {}

  QXArray values();
  QXValue value();
  QXError error();
  // Fails when bytes or descriptors are left over.
  void finish();

 private:
  bool countElements(std::size_t count);
  bool enter();
  void leave() { --depth_; }
  QXURL url();
  QXArray elements();
  QXDictionary dictionary();
  QXValue descriptor();

  ByteReader& bytes_;
  std::vector<UniqueDescriptor> descriptors_;
  std::size_t usedDescriptors_ = 0;
  std::size_t depth_ = 0;
  std::size_t elements_ = 0;
};

struct EncodedValue {
  std::vector<std::uint8_t> bytes;
  std::vector<QXDescriptor> descriptors;
};

// One value by itself.
[[nodiscard]] std::variant<EncodedValue, Malformed> encodeValue(const QXValue& value);
[[nodiscard]] std::variant<QXValue, Malformed> decodeValue(std::span<const std::uint8_t> bytes, std::vector<UniqueDescriptor> descriptors);

}  // namespace docuvend::linux_platform
