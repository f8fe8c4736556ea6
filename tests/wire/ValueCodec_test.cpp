#include "platform/linux/wire/ValueCodec.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "platform/linux/wire/Limits.h"

namespace docuvend::linux_platform {
namespace {

using Bytes = std::vector<std::uint8_t>;

QXURL url(const char* text) { return *QXURL::fromString(text); }

QXValue nested(std::size_t depth) {
  QXValue value("bottom");
  for (std::size_t i = 0; i < depth; ++i) value = QXValue(QXArray{value});
  return value;
}

QXError chain(std::size_t length) {
  QXError error = QXError::make("d", 0, "bottom");
  for (std::size_t i = 1; i < length; ++i) {
    QXError outer = QXError::make("d", static_cast<std::int64_t>(i), "outer");
    outer.underlying = std::make_shared<const QXError>(error);
    error = outer;
  }
  return error;
}

QXError fullError() {
  QXError error = QXError::make("A domain", -5, "Something");
  error.texts.emplace("parameter", "url");
  error.url = url("file:///a%20b/c");
  error.underlying = std::make_shared<const QXError>(QXError::system(2, "below"));
  return error;
}

std::vector<QXValue> everyKind() {
  return {
      QXValue(),
      QXValue(true),
      QXValue(false),
      QXValue(std::int64_t{0}),
      QXValue(std::numeric_limits<std::int64_t>::min()),
      QXValue(std::numeric_limits<std::int64_t>::max()),
      QXValue(1.5),
      QXValue(-std::numeric_limits<double>::infinity()),
      QXValue(std::numeric_limits<double>::denorm_min()),
      QXValue(""),
      QXValue("tab\tline\r\nümlaut \xF0\x9F\x93\x84"),
      QXValue(std::string(kMaximumTextBytes, 'x')),
      QXValue(QXData{}),
      QXValue(QXData{{0, 1, 255}}),
      QXValue(url("file:///")),
      QXValue(url("file:///a//b%01/")),
      QXValue(QXUUID{{1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 255}}),
      QXValue(QXArray{}),
      QXValue(QXArray{QXValue(1), QXValue(), QXValue(QXArray{QXValue("in")})}),
      QXValue(QXDictionary{}),
      QXValue(QXDictionary{{"", QXValue(1)}, {"k", QXValue(QXDictionary{{"u", QXValue(url("file:///x"))}})}}),
      QXValue(QXError{}),
      QXValue(fullError()),
      nested(kMaximumNesting),
      QXValue(chain(kMaximumNesting)),
      QXValue(QXArray(kMaximumElements - 1)),
  };
}

TEST(ValueCodecTest, EveryKindOfValueComesBackAsItWent) {
  for (const QXValue& value : everyKind()) {
    const auto encoded = encodeValue(value);
    ASSERT_TRUE(std::holds_alternative<EncodedValue>(encoded)) << value.description();
    const auto decoded = decodeValue(std::get<EncodedValue>(encoded).bytes, {});
    ASSERT_TRUE(std::holds_alternative<QXValue>(decoded)) << value.description() << ": " << std::get<Malformed>(decoded).reason;
    EXPECT_EQ(std::get<QXValue>(decoded), value);
  }
}

TEST(ValueCodecTest, NotANumberComesBackAsOne) {
  const auto encoded = encodeValue(QXValue(std::nan("")));
  const auto decoded = decodeValue(std::get<EncodedValue>(encoded).bytes, {});
  EXPECT_TRUE(std::isnan(*std::get<QXValue>(decoded).as<double>()));
}

TEST(ValueCodecTest, ADescriptorTravelsBesideTheBytes) {
  const auto encoded = encodeValue(QXValue(QXDescriptor{0, nullptr}));
  const auto& value = std::get<EncodedValue>(encoded);
  EXPECT_EQ(value.bytes, Bytes{11});
  ASSERT_EQ(value.descriptors.size(), 1U);
  std::vector<UniqueDescriptor> came;
  came.emplace_back(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  const int number = came.front().get();
  {
    const auto decoded = decodeValue(value.bytes, std::move(came));
    EXPECT_EQ(std::get<QXValue>(decoded), QXValue(QXDescriptor{number, nullptr}));
    EXPECT_GE(::fcntl(number, F_GETFD), 0);
  }
  EXPECT_LT(::fcntl(number, F_GETFD), 0) << "closed with the value";
}

struct Unsendable {
  const char* name;
  QXValue value;
};

TEST(ValueCodecTest, WhatCannotBeCarriedIsNotWritten) {
  QXError badText = QXError::make("d", 1, "bell \x07");
  QXError badDomain = QXError::make("\xC0\x80", 1, "");
  const std::vector<Unsendable> table = {
      {"U+0001", QXValue("\x01")},
      {"U+0000", QXValue(std::string("a\0b", 3))},
      {"U+FFFF", QXValue("\xEF\xBF\xBF")},
      {"invalid UTF-8", QXValue("\xFF")},
      {"overlong UTF-8", QXValue("\xC0\x80")},
      {"surrogate", QXValue("\xED\xA0\x80")},
      {"cut sequence", QXValue("\xE2\x82")},
      {"long string", QXValue(std::string(kMaximumTextBytes + 1, 'x'))},
      {"long data", QXValue(QXData{Bytes(kMaximumFrameBytes + 1)})},
      {"key", QXValue(QXDictionary{{"\x02", QXValue(1)}})},
      {"inner", QXValue(QXArray{QXValue(QXDictionary{{"k", QXValue("\x03")}})})},
      {"error text", QXValue(badText)},
      {"error domain", QXValue(badDomain)},
      {"nesting", nested(kMaximumNesting + 1)},
      {"error nesting", QXValue(chain(kMaximumNesting + 1))},
      {"elements", QXValue(QXArray(kMaximumElements))},
      {"inner descriptor", QXValue(QXArray{QXValue(QXDescriptor{0, nullptr})})},
      {"closed descriptor", QXValue(QXDescriptor{})},
  };
  for (const auto& [name, value] : table) EXPECT_TRUE(std::holds_alternative<Malformed>(encodeValue(value))) << name;
}

struct BadBytes {
  const char* name;
  Bytes bytes;
  const char* reason;
};

TEST(ValueCodecTest, BytesThatAreNoValueAreRefusedWithTheReason) {
  const std::vector<BadBytes> table = {
      {"nothing", {}, "a frame that ends inside a value"},
      {"tag", {12}, "a value of unknown type 12"},
      {"boolean", {1, 2}, "a boolean that is neither 0 nor 1"},
      {"short integer", {2, 0, 0, 0}, "a frame that ends inside a value"},
      {"string without length", {4, 1, 0}, "a frame that ends inside a value"},
      {"string longer than the frame", {4, 5, 0, 0, 0, 'a'}, "a frame that ends inside a value"},
      {"string over the limit", {4, 1, 0, 1, 0}, "a text of 65537 bytes"},
      {"string of 4 GiB", {4, 255, 255, 255, 255}, "a text of 4294967295 bytes"},
      {"invalid UTF-8", {4, 1, 0, 0, 0, 255}, "a text with characters that cannot be carried"},
      {"overlong UTF-8", {4, 2, 0, 0, 0, 0xC0, 0x80}, "a text with characters that cannot be carried"},
      {"NUL", {4, 1, 0, 0, 0, 0}, "a text with characters that cannot be carried"},
      {"U+0001", {4, 1, 0, 0, 0, 1}, "a text with characters that cannot be carried"},
      {"U+FFFE", {4, 3, 0, 0, 0, 0xEF, 0xBF, 0xBE}, "a text with characters that cannot be carried"},
      {"data of 4 GiB", {5, 255, 255, 255, 255}, "a frame that ends inside a value"},
      {"no URL", {6, 1, 0, 0, 0, 'a'}, "a text that is no file URL"},
      {"short UUID", {7, 1, 2, 3}, "a frame that ends inside a value"},
      {"array longer than the frame", {8, 2, 0, 0, 0, 0}, "a frame that ends inside a value"},
      {"array of 4 Gi", {8, 255, 255, 255, 255}, "too many values"},
      {"array at the limit", {8, 0, 0x40, 0, 0}, "a frame that ends inside a value"},
      {"array just over the limit", {8, 1, 0x40, 0, 0}, "too many values"},
      {"dictionary of 4 Gi", {9, 255, 255, 255, 255}, "too many values"},
      {"one key twice", {9, 2, 0, 0, 0, 1, 0, 0, 0, 'k', 0, 1, 0, 0, 0, 'k', 0}, "a dictionary with one key twice"},
      {"key with U+0001", {9, 1, 0, 0, 0, 1, 0, 0, 0, 1, 0}, "a text with characters that cannot be carried"},
      {"error mark", {10, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 2, 0}, "a mark of a URL that is neither 0 nor 1"},
      {"descriptor", {11}, "a descriptor that did not come"},
      {"descriptor in an array", {8, 1, 0, 0, 0, 11}, "a descriptor inside another value"},
      {"trailing", {0, 0}, "1 bytes after the end of a frame's contents"},
  };
  for (const auto& [name, bytes, reason] : table) {
    const auto decoded = decodeValue(bytes, {});
    ASSERT_TRUE(std::holds_alternative<Malformed>(decoded)) << name;
    EXPECT_EQ(std::get<Malformed>(decoded).reason, reason) << name;
  }
}

TEST(ValueCodecTest, NestingOverTheLimitIsRefusedBeforeItIsFollowed) {
  Bytes bytes;
  for (int i = 0; i < 100000; ++i) bytes.insert(bytes.end(), {8, 1, 0, 0, 0});
  const auto decoded = decodeValue(bytes, {});
  ASSERT_TRUE(std::holds_alternative<Malformed>(decoded));
  EXPECT_EQ(std::get<Malformed>(decoded).reason, "values nested too deeply");
}

TEST(ValueCodecTest, ADescriptorThatNoValueUsesIsClosedAndRefused) {
  std::vector<UniqueDescriptor> came;
  came.emplace_back(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  const int number = came.front().get();
  const auto decoded = decodeValue(Bytes{0}, std::move(came));
  ASSERT_TRUE(std::holds_alternative<Malformed>(decoded));
  EXPECT_EQ(std::get<Malformed>(decoded).reason, "a descriptor that no value uses");
  EXPECT_LT(::fcntl(number, F_GETFD), 0);
}

TEST(ValueCodecTest, EveryPrefixOfAValueIsRefused) {
  for (const QXValue& value : everyKind()) {
    auto bytes = std::get<EncodedValue>(encodeValue(value)).bytes;
    if (bytes.size() > 1000) continue;
    while (!bytes.empty()) {
      bytes.pop_back();
      EXPECT_TRUE(std::holds_alternative<Malformed>(decodeValue(bytes, {}))) << value.description() << " cut to " << bytes.size();
    }
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
