#include "platform/linux/wire/ValueCodec.h"

#include <algorithm>
#include <bit>
#include <limits>
#include <memory>
#include <utility>

#include "platform/linux/wire/Limits.h"

namespace docuvend::linux_platform {

static_assert(std::numeric_limits<double>::is_iec559 && sizeof(double) == sizeof(std::uint64_t));

struct ValueWriter::Visitor {
  ValueWriter& writer;

  // The value when it is of that type.
  template <class T>
  void when(const QXValue& value) const {
    if (const T* held = value.as<T>()) (*this)(*held);
  }
  template <class... Ts>
  void visit(const QXValue& value) const {
    (when<Ts>(value), ...);
  }

  void operator()(bool value) const { writer.bytes_.u8(value ? 1 : 0); }
  void operator()(std::int64_t value) const { writer.bytes_.u64(static_cast<std::uint64_t>(value)); }
  void operator()(double value) const { writer.bytes_.u64(std::bit_cast<std::uint64_t>(value)); }
  void operator()(const std::string& value) const { writer.bytes_.text(value); }
  void operator()(const QXData& value) const {
    if (value.bytes.size() > kMaximumFrameBytes) return writer.bytes_.fail("data longer than a frame");
    writer.bytes_.u32(static_cast<std::uint32_t>(value.bytes.size()));
    writer.bytes_.raw(value.bytes);
  }
  void operator()(const QXURL& value) const { writer.url(value); }
  void operator()(const QXUUID& value) const { writer.bytes_.raw(value.bytes); }
  void operator()(const QXArray& value) const {
    if (!writer.enter()) return;
    writer.bytes_.u32(static_cast<std::uint32_t>(value.size()));
    for (const QXValue& element : value) writer.value(element);
    writer.leave();
  }
  void operator()(const QXDictionary& value) const {
    if (!writer.enter()) return;
    writer.bytes_.u32(static_cast<std::uint32_t>(value.size()));
    for (const auto& [key, element] : value) {
      writer.bytes_.text(key);
      writer.value(element);
    }
    writer.leave();
  }
  void operator()(const QXError& value) const { writer.error(value); }
  void operator()(const QXDescriptor& value) const {
    if (writer.depth_ > 0) return writer.bytes_.fail("a descriptor inside another value");
    if (value.number < 0) return writer.bytes_.fail("a descriptor that is not open");
    if (writer.descriptors_.size() == kMaximumDescriptors) return writer.bytes_.fail("too many descriptors");
    writer.descriptors_.push_back(value);
  }
};

void ValueWriter::countElement() {
  if (++elements_ > kMaximumElements) bytes_.fail("too many values");
}

bool ValueWriter::enter() {
  if (depth_ == kMaximumNesting) bytes_.fail("values nested too deeply");
  if (bytes_.failure()) return false;
  ++depth_;
  return true;
}

void ValueWriter::url(const QXURL& url) { bytes_.text(url.absoluteString()); }

void ValueWriter::values(const QXArray& values) {
  bytes_.u32(static_cast<std::uint32_t>(values.size()));
  for (const QXValue& element : values) value(element);
}

void ValueWriter::value(const QXValue& value) {
  countElement();
  if (bytes_.failure()) return;
  bytes_.u8(static_cast<std::uint8_t>(value.kind()));
  Visitor{*this}.visit<bool, std::int64_t, double, std::string, QXData, QXURL, QXUUID, QXArray, QXDictionary, QXError, QXDescriptor>(value);
}

void ValueWriter::error(const QXError& error) {
  if (!enter()) return;
  bytes_.text(error.domain);
  bytes_.u64(static_cast<std::uint64_t>(error.code));
  bytes_.u32(static_cast<std::uint32_t>(error.texts.size()));
  for (const auto& [key, text] : error.texts) {
    countElement();
    if (bytes_.failure()) return;
    bytes_.text(key);
    bytes_.text(text);
  }
  bytes_.u8(error.url ? 1 : 0);
  if (error.url) url(*error.url);
  bytes_.u8(error.underlying ? 1 : 0);
  if (error.underlying) this->error(*error.underlying);
  leave();
}

bool ValueReader::countElements(std::size_t count) {
  if (count > kMaximumElements - elements_) {
    bytes_.fail("too many values");
    return false;
  }
  elements_ += count;
  return bytes_.ok();
}

bool ValueReader::enter() {
  if (depth_ == kMaximumNesting) {
    bytes_.fail("values nested too deeply");
    return false;
  }
  ++depth_;
  return bytes_.ok();
}

QXURL ValueReader::url() {
  const std::string text = bytes_.text();
  auto url = QXURL::fromString(text);
  if (!url) {
    bytes_.fail("a text that is no file URL");
    return QXURL::fileURL("/", QXURLKind::directory);
  }
  return *std::move(url);
}

QXArray ValueReader::elements() {
  const std::size_t count = bytes_.u32();
  QXArray array;
  if (!countElements(count)) return array;
  for (std::size_t i = 0; i < count && bytes_.ok(); ++i) array.push_back(value());
  return array;
}

QXArray ValueReader::values() { return elements(); }

QXDictionary ValueReader::dictionary() {
  const std::size_t count = bytes_.u32();
  QXDictionary dictionary;
  if (!countElements(count)) return dictionary;
  for (std::size_t i = 0; i < count && bytes_.ok(); ++i) {
    std::string key = bytes_.text();
    QXValue element = value();
    if (!dictionary.emplace(std::move(key), std::move(element)).second) bytes_.fail("a dictionary with one key twice");
  }
  return dictionary;
}

QXError ValueReader::error() {
  QXError error;
  if (!enter()) return error;
  error.domain = bytes_.text();
  error.code = static_cast<std::int64_t>(bytes_.u64());
  const std::size_t count = bytes_.u32();
  if (countElements(count)) {
    for (std::size_t i = 0; i < count && bytes_.ok(); ++i) {
      std::string key = bytes_.text();
      if (!error.texts.emplace(std::move(key), bytes_.text()).second) bytes_.fail("an error with one text twice");
    }
  }
  if (bytes_.flag("a mark of a URL")) error.url = url();
  if (bytes_.flag("a mark of an underlying error")) error.underlying = std::make_shared<const QXError>(this->error());
  leave();
  return error;
}

QXValue ValueReader::descriptor() {
  if (depth_ > 0) {
    bytes_.fail("a descriptor inside another value");
    return {};
  }
  if (usedDescriptors_ == descriptors_.size()) {
    bytes_.fail("a descriptor that did not come");
    return {};
  }
  return toValue(std::move(descriptors_[usedDescriptors_++]));
}

QXValue ValueReader::value() {
  const std::uint8_t tag = bytes_.u8();
  if (!bytes_.ok()) return {};
  switch (tag) {
    case static_cast<std::uint8_t>(QXValueKind::absent):
      return {};
    case static_cast<std::uint8_t>(QXValueKind::boolean):
      return bytes_.flag("a boolean");
    case static_cast<std::uint8_t>(QXValueKind::integer):
      return static_cast<std::int64_t>(bytes_.u64());
    case static_cast<std::uint8_t>(QXValueKind::real):
      return std::bit_cast<double>(bytes_.u64());
    case static_cast<std::uint8_t>(QXValueKind::string):
      return bytes_.text();
    case static_cast<std::uint8_t>(QXValueKind::data): {
      const auto bytes = bytes_.raw(bytes_.u32());
      return QXData{{bytes.begin(), bytes.end()}};
    }
    case static_cast<std::uint8_t>(QXValueKind::url):
      return url();
    case static_cast<std::uint8_t>(QXValueKind::uuid): {
      QXUUID uuid;
      const auto bytes = bytes_.raw(uuid.bytes.size());
      std::copy(bytes.begin(), bytes.end(), uuid.bytes.begin());
      return uuid;
    }
    case static_cast<std::uint8_t>(QXValueKind::array): {
      if (!enter()) return {};
      QXArray array = elements();
      leave();
      return array;
    }
    case static_cast<std::uint8_t>(QXValueKind::dictionary): {
      if (!enter()) return {};
      QXDictionary entries = dictionary();
      leave();
      return entries;
    }
    case static_cast<std::uint8_t>(QXValueKind::error):
      return error();
    case static_cast<std::uint8_t>(QXValueKind::descriptor):
      return descriptor();
    default:
      bytes_.fail("a value of unknown type " + std::to_string(tag));
      return {};
  }
}

void ValueReader::finish() {
  if (bytes_.remaining() > 0) bytes_.fail(std::to_string(bytes_.remaining()) + " bytes after the end of a frame's contents");
  if (usedDescriptors_ < descriptors_.size()) bytes_.fail("a descriptor that no value uses");
}

std::variant<EncodedValue, Malformed> encodeValue(const QXValue& value) {
  ByteWriter bytes;
  ValueWriter writer(bytes);
  writer.value(value);
  if (bytes.failure()) return *bytes.failure();
  return EncodedValue{bytes.take(), writer.takeDescriptors()};
}

std::variant<QXValue, Malformed> decodeValue(std::span<const std::uint8_t> bytes, std::vector<UniqueDescriptor> descriptors) {
  ByteReader reader(bytes);
  ValueReader values(reader, std::move(descriptors));
  QXValue value = values.value();
  values.finish();
  if (reader.failure()) return *reader.failure();
  return value;
}

}  // namespace docuvend::linux_platform
