#include "platform/linux/wire/Bytes.h"

#include "platform/linux/wire/Limits.h"
#include "platform/xml_text.h"

namespace docuvend::linux_platform {
namespace {

constexpr unsigned kBitsPerByte = 8;

template <class Number>
Number littleEndian(std::span<const std::uint8_t> bytes) {
  Number value = 0;
  for (std::size_t i = 0; i < bytes.size(); ++i) value |= static_cast<Number>(Number{bytes[i]} << (kBitsPerByte * i));
  return value;
}

}  // namespace

bool isTransmissibleText(std::string_view text) { return qxIsXMLText(text); }

void ByteWriter::u32(std::uint32_t value) {
  for (unsigned i = 0; i < sizeof value; ++i) bytes_.push_back(static_cast<std::uint8_t>(value >> (kBitsPerByte * i)));
}

void ByteWriter::u64(std::uint64_t value) {
  for (unsigned i = 0; i < sizeof value; ++i) bytes_.push_back(static_cast<std::uint8_t>(value >> (kBitsPerByte * i)));
}

void ByteWriter::text(std::string_view text) {
  if (text.size() > kMaximumTextBytes) return fail("a text of " + std::to_string(text.size()) + " bytes");
  if (!isTransmissibleText(text)) return fail("a text with characters that cannot be carried");
  u32(static_cast<std::uint32_t>(text.size()));
  bytes_.insert(bytes_.end(), text.begin(), text.end());
}

void ByteWriter::setU32At(std::size_t position, std::uint32_t value) {
  for (unsigned i = 0; i < sizeof value; ++i) bytes_[position + i] = static_cast<std::uint8_t>(value >> (kBitsPerByte * i));
}

void ByteWriter::fail(std::string reason) {
  if (!failure_) failure_ = Malformed{std::move(reason)};
}

void ByteReader::fail(std::string reason) {
  if (!failure_) failure_ = Malformed{std::move(reason)};
  rest_ = {};
}

std::span<const std::uint8_t> ByteReader::raw(std::size_t count) {
  if (count > rest_.size()) {
    fail("a frame that ends inside a value");
    return {};
  }
  const auto taken = rest_.first(count);
  rest_ = rest_.subspan(count);
  return taken;
}

std::uint8_t ByteReader::u8() { return littleEndian<std::uint8_t>(raw(sizeof(std::uint8_t))); }

std::uint32_t ByteReader::u32() { return littleEndian<std::uint32_t>(raw(sizeof(std::uint32_t))); }

std::uint64_t ByteReader::u64() { return littleEndian<std::uint64_t>(raw(sizeof(std::uint64_t))); }

bool ByteReader::flag(const char* what) {
  const std::uint8_t value = u8();
  if (value > 1) fail(std::string(what) + " that is neither 0 nor 1");
  return value == 1;
}

std::string ByteReader::text() {
  const std::uint32_t length = u32();
  if (length > kMaximumTextBytes) {
    fail("a text of " + std::to_string(length) + " bytes");
    return {};
  }
  const auto bytes = raw(length);
  std::string text(bytes.begin(), bytes.end());
  if (!isTransmissibleText(text)) {
    fail("a text with characters that cannot be carried");
    return {};
  }
  return text;
}

}  // namespace docuvend::linux_platform
