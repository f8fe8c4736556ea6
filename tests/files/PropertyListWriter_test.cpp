#include "platform/linux/files/PropertyListWriter.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/files/PropertyListParser.h"
#include "platform/linux/files/property_list_scalars.h"

namespace docuvend::linux_platform {
namespace {

TEST(PropertyListWriter, WritesSortedKeysAndOneTabForEachLevel) {
  const QXDictionary dictionary = {
      {"b", QXDictionary{{"list", QXArray{"x", 1, QXDictionary{}}}, {"none", QXArray{}}}},
      {"a", true},
      {"c", QXData{{0, 255}}},
      {"d", 1.5},
      {"e", false},
  };
  EXPECT_EQ(propertyListXML(dictionary), R"(<?xml version="1.0" encoding="UTF-8"?>
<plist version="1.0">
<dict>
	<key>a</key>
	<true/>
	<key>b</key>
	<dict>
		<key>list</key>
		<array>
			<string>x</string>
			<integer>1</integer>
			<dict/>
		</array>
		<key>none</key>
		<array/>
	</dict>
	<key>c</key>
	<data>AP8=</data>
	<key>d</key>
	<real>1.5</real>
	<key>e</key>
	<false/>
</dict>
</plist>
)");
}

TEST(PropertyListWriter, AnEmptyDictionaryIsAListToo) {
  EXPECT_EQ(propertyListXML({}), "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict/>\n</plist>\n");
}

TEST(PropertyListWriter, EscapesMarkupAndCarriageReturns) {
  const auto text = propertyListXML({{"a<b", "&<>\"'\r\n\t]]>"}});
  ASSERT_TRUE(text);
  EXPECT_NE(text->find("<key>a&lt;b</key>"), std::string::npos) << *text;
  EXPECT_NE(text->find("<string>&amp;&lt;&gt;\"'&#13;\n\t]]&gt;</string>"), std::string::npos) << *text;
}

TEST(PropertyListWriter, RefusesWhatAListCannotCarryAtAnyDepth) {
  const std::vector<QXValue> values = {
      QXValue(),
      QXURL::fileURL("/a", QXURLKind::file),
      QXUUID{},
      QXError::system(1, "no"),
      QXDescriptor{},
      std::nan(""),
      std::numeric_limits<double>::infinity(),
      -std::numeric_limits<double>::infinity(),
      std::string(1, '\0'),
      "\x01",
      "\x1F",
      "\xFF",
      "\xC0\x80",
      "\xED\xA0\x80",
      "\xEF\xBF\xBE",
      "\xEF\xBF\xBF",
  };
  for (const QXValue& value : values) {
    EXPECT_FALSE(propertyListXML({{"a", value}})) << value.description();
    EXPECT_FALSE(propertyListXML({{"a", QXArray{true, value}}})) << value.description();
    EXPECT_FALSE(propertyListXML({{"a", QXDictionary{{"b", value}}}})) << value.description();
    if (const auto* text = value.as<std::string>()) {
      EXPECT_FALSE(propertyListXML({{*text, true}})) << value.description();
    }
  }
}

// A dictionary with that many elements inside each other in the written list, counting <plist>, itself and the innermost leaf.
QXDictionary nested(std::size_t depth) {
  QXValue value = true;
  for (std::size_t i = 3; i < depth; ++i) value = QXArray{std::move(value)};
  return {{"a", std::move(value)}};
}

TEST(PropertyListWriter, WritesAsDeepAsReadingGoesAndNoDeeper) {
  const auto text = propertyListXML(nested(kPropertyListMaximumDepth));
  ASSERT_TRUE(text);
  PropertyListParser parser;
  EXPECT_TRUE(parser.feed(*text));
  EXPECT_EQ(parser.finish(), (std::variant<QXValue, QXError>(QXValue(nested(kPropertyListMaximumDepth)))));
  EXPECT_FALSE(propertyListXML(nested(kPropertyListMaximumDepth + 1)));
}

TEST(PropertyListWriter, WritesAsManyElementsAsReadingTakesAndNoMore) {
  const std::size_t besides = 4;  // <plist>, <dict>, <key>, <array>
  QXArray array(kPropertyListMaximumElements - besides, QXValue(true));
  const auto text = propertyListXML({{"a", array}});
  ASSERT_TRUE(text);
  PropertyListParser parser;
  EXPECT_TRUE(parser.feed(*text));
  EXPECT_TRUE(std::holds_alternative<QXValue>(parser.finish()));
  array.emplace_back(true);
  EXPECT_FALSE(propertyListXML({{"a", array}}));
}

TEST(PropertyListWriter, WritesNoLongerTextThanReadingTakes) {
  const std::size_t around = propertyListXML({{"a", ""}})->size();
  EXPECT_TRUE(propertyListXML({{"a", std::string(kPropertyListMaximumBytes - around, 'x')}}));
  EXPECT_FALSE(propertyListXML({{"a", std::string(kPropertyListMaximumBytes - around + 1, 'x')}}));
}

// Values that are hard to carry, chosen by a seed.
class RandomValues {
 public:
  explicit RandomValues(std::uint64_t seed) : random_(seed) {}

  QXDictionary dictionary(int depth) {
    QXDictionary made;
    for (std::size_t i = below(5); i > 0; --i) made.insert_or_assign(text(), value(depth - 1));
    return made;
  }

 private:
  QXValue value(int depth) {
    switch (below(depth > 0 ? 8 : 5)) {
      case 0:
        return below(2) == 1;
      case 1:
        return static_cast<std::int64_t>(random_() >> below(64)) * (below(2) == 1 ? 1 : -1);
      case 2:
        return real();
      case 3:
        return text();
      case 4:
        return data();
      case 5: {
        QXArray array;
        for (std::size_t i = below(5); i > 0; --i) array.push_back(value(depth - 1));
        return array;
      }
      default:
        return dictionary(depth);
    }
  }

  double real() {
    static constexpr double kReals[] = {0.0, -0.0, 0.1, 5e-324, 1.7976931348623157e308, 1.0 / 3.0};
    const std::size_t choice = below(std::size(kReals) + 1);
    return choice < std::size(kReals) ? kReals[choice] : std::ldexp(static_cast<double>(random_()), static_cast<int>(below(200)) - 100);
  }

  std::string text() {
    static constexpr std::string_view kPieces[] = {"a",
                                                   " ",
                                                   "\t",
                                                   "\n",
                                                   "\r",
                                                   "\r\n",
                                                   "&",
                                                   "<",
                                                   ">",
                                                   "\"",
                                                   "'",
                                                   "]]>",
                                                   "&#13;",
                                                   "<!--",
                                                   "\x7F",
                                                   "%@",
                                                   "\xC2\x85",
                                                   "\xE2\x80\xA8",
                                                   "\xEF\xBF\xBD",
                                                   "\xF4\x8F\xBF\xBF",
                                                   "e\xCC\x81"};
    std::string made;
    for (std::size_t i = below(8); i > 0; --i) made += kPieces[below(std::size(kPieces))];
    return made;
  }

  QXData data() {
    QXData made;
    for (std::size_t i = below(9); i > 0; --i) made.bytes.push_back(static_cast<std::uint8_t>(random_()));
    return made;
  }

  std::size_t below(std::size_t count) { return random_() % count; }

  std::mt19937_64 random_;
};

TEST(PropertyListWriter, WhateverIsWrittenReadsBackTheSame) {
  for (std::uint64_t seed = 1; seed <= 2000; ++seed) {
    const QXDictionary dictionary = RandomValues(seed).dictionary(5);
    const auto text = propertyListXML(dictionary);
    ASSERT_TRUE(text) << "seed " << seed << "\n" << QXValue(dictionary).description();
    PropertyListParser parser;
    ASSERT_TRUE(parser.feed(*text)) << "seed " << seed << "\n" << *text;
    const auto result = parser.finish();
    const auto* value = std::get_if<QXValue>(&result);
    ASSERT_NE(value, nullptr) << "seed " << seed << "\n" << *text;
    ASSERT_EQ(*value, QXValue(dictionary)) << "seed " << seed << "\n" << *text;
    ASSERT_EQ(propertyListXML(*value->as<QXDictionary>()), text) << "seed " << seed;
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
