#include "platform/linux/files/PropertyListParser.h"

#include <gtest/gtest.h>

#include <string>
#include <variant>
#include <vector>

#include "platform/linux/files/property_list_scalars.h"

namespace docuvend::linux_platform {
namespace {

constexpr const char* kHead = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";

std::string listOf(const std::string& value) { return kHead + value + "\n</plist>\n"; }

std::variant<QXValue, QXError> parsed(const std::string& text) {
  PropertyListParser parser;
  if (!parser.feed(text)) return parser.finish();
  return parser.finish();
}

std::string times(std::size_t count, const std::string& text) {
  std::string all;
  for (std::size_t i = 0; i < count; ++i) all += text;
  return all;
}

struct Good {
  std::string text;
  QXValue value;
};

const std::vector<Good>& goodLists() {
  static const std::vector<Good> kLists = {
      {listOf("<dict/>"), QXDictionary{}},
      {listOf("<dict></dict>"), QXDictionary{}},
      {listOf("<array/>"), QXArray{}},
      {listOf("<string/>"), ""},
      {listOf("<string> a\n\tb </string>"), " a\n\tb "},
      {listOf("<string>a\r\nb\rc&#13;d&#xD;</string>"), "a\nb\nc\rd\r"},
      {listOf("<string>&lt;&gt;&amp;&quot;&apos;&#65;&#x1F600;</string>"), "<>&\"'A\xF0\x9F\x98\x80"},
      {listOf("<string>\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80</string>"), "\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80"},
      {listOf("<string>a<![CDATA[<b>&amp;]]>c</string>"), "a<b>&amp;c"},
      {listOf("<string>a<!-- not this -->b</string>"), "ab"},
      {listOf("<integer>0</integer>"), 0},
      {listOf("<integer> -12\n</integer>"), -12},
      {listOf("<integer>9223372036854775807</integer>"), INT64_MAX},
      {listOf("<integer>-9223372036854775808</integer>"), INT64_MIN},
      {listOf("<real>1.5</real>"), 1.5},
      {listOf("<real>-2e-3</real>"), -0.002},
      {listOf("<real>7</real>"), 7.0},
      {listOf("<true/>"), true},
      {listOf("<false></false>"), false},
      {listOf("<data></data>"), QXData{}},
      {listOf("<data>AA==</data>"), QXData{{0}}},
      {listOf("<data>\n\tAAEC\n\t/+8=\n</data>"), QXData{{0, 1, 2, 0xFF, 0xEF}}},
      {listOf("<dict><key>b</key><integer>1</integer><key>a</key><dict><key/><array><true/></array></dict></dict>"),
       QXDictionary{{"a", QXDictionary{{"", QXArray{true}}}}, {"b", 1}}},
      {"<plist><string>x</string></plist>", "x"},
      {"<?xml version=\"1.0\"?><!DOCTYPE plist><plist version=\"1.0\"><string>x</string></plist>", "x"},
      {"<!DOCTYPE plist SYSTEM \"file:///etc/passwd\"><plist version=\"1.0\"><string>x</string></plist>", "x"},
      {"<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?><plist version=\"1.0\"><string>\xE9</string></plist>", "\xC3\xA9"},
      {"\xEF\xBB\xBF<plist version=\"1.0\"><string>x</string></plist>", "x"},
      {"<!-- before --><?pi?><plist version=\"1.0\"><!-- in --><string>x</string><?pi?></plist><!-- after -->\n", "x"},
  };
  return kLists;
}

TEST(PropertyListParser, ReadsEveryKindOfValue) {
  for (const Good& good : goodLists()) {
    const auto result = parsed(good.text);
    const auto* value = std::get_if<QXValue>(&result);
    ASSERT_NE(value, nullptr) << good.text << "\n" << std::get<QXError>(result).description();
    EXPECT_EQ(value->kind(), good.value.kind()) << good.text;
    EXPECT_EQ(*value, good.value) << good.text << "\n" << value->description();
  }
}

TEST(PropertyListParser, ReadsTheSameWhereverTheTextIsCut) {
  for (const Good& good : goodLists()) {
    PropertyListParser parser;
    for (const char c : good.text) ASSERT_TRUE(parser.feed({&c, 1})) << good.text;
    EXPECT_EQ(parser.finish(), (std::variant<QXValue, QXError>(good.value))) << good.text;
  }
}

struct Bad {
  std::string text;
  std::string why;
};

TEST(PropertyListParser, RefusesWhatIsNoPropertyListAndSaysWhere) {
  const std::vector<Bad> lists = {
      {"", "line 1: "},
      {" \n ", "line 2: "},
      {"not XML", "line 1: "},
      {std::string("\0\0\0", 3), "line 1: "},
      {"<plist version=\"1.0\">", "line 1: "},
      {kHead, "line 3: "},
      {listOf("<string>a"), "line 4: "},
      {listOf("<string>a</strong>"), "line 3: "},
      {"<dict/>", "line 1: the outermost element is not <plist>"},
      {"<html/>", "line 1: <html> is no element of a property list"},
      {"<plist version=\"2.0\"><dict/></plist>", "line 1: this version of property lists is not known"},
      {"<plist kind=\"1.0\"><dict/></plist>", "line 1: <plist> has the attribute \"kind\""},
      {listOf("<dict a=\"b\"/>"), "line 3: <dict> has the attribute \"a\""},
      {listOf(""), "line 4: there is no value in <plist>"},
      {listOf("<true/><true/>"), "line 3: there is more than one value in <plist>"},
      {listOf("<true/>") + "<plist/>", "line 5: "},
      {listOf("<true/>") + "text", "line 5: "},
      {listOf("text"), "there is text between the elements of <plist>"},
      {listOf("<array>text</array>"), "line 3: there is text between the elements of <array>"},
      {listOf("<dict>text</dict>"), "line 3: there is text between the elements of <dict>"},
      {listOf("<plist><true/></plist>"), "line 3: <plist> must not stand inside <plist>"},
      {listOf("<string><string/></string>"), "line 3: <string> must not stand inside <string>"},
      {listOf("<dict><key><true/></key></dict>"), "line 3: <true> must not stand inside <key>"},
      {listOf("<key>a</key>"), "line 3: a <key> stands where a value is due"},
      {listOf("<array><key>a</key></array>"), "line 3: a <key> stands where a value is due"},
      {listOf("<dict><key>a</key><key>b</key></dict>"), "line 3: a <key> stands where a value is due"},
      {listOf("<dict><true/></dict>"), "line 3: a value in a <dict> has no <key>"},
      {listOf("<dict>\n<key>a</key>\n</dict>"), "line 5: the key \"a\" has no value"},
      {listOf("<dict><key>a</key><true/>\n<key>a</key><true/></dict>"), "line 4: the key \"a\" is there twice"},
      {listOf("<date>2001-01-01T00:00:00Z</date>"), "line 3: <date> is no element of a property list"},
      {listOf("<true>yes</true>"), "line 3: the content of <true> is not one"},
      {listOf("<integer></integer>"), "line 3: the content of <integer> is not one"},
      {listOf("<integer>1.0</integer>"), "line 3: the content of <integer> is not one"},
      {listOf("<integer>1 2</integer>"), "line 3: the content of <integer> is not one"},
      {listOf("<integer>0x10</integer>"), "line 3: the content of <integer> is not one"},
      {listOf("<integer>9223372036854775808</integer>"), "line 3: the content of <integer> is not one"},
      {listOf("<real></real>"), "line 3: the content of <real> is not one"},
      {listOf("<real>1,5</real>"), "line 3: the content of <real> is not one"},
      {listOf("<real>inf</real>"), "line 3: the content of <real> is not one"},
      {listOf("<real>nan</real>"), "line 3: the content of <real> is not one"},
      {listOf("<real>1e999</real>"), "line 3: the content of <real> is not one"},
      {listOf("<data>A</data>"), "line 3: the content of <data> is not one"},
      {listOf("<data>AA=</data>"), "line 3: the content of <data> is not one"},
      {listOf("<data>A===</data>"), "line 3: the content of <data> is not one"},
      {listOf("<data>AA=A</data>"), "line 3: the content of <data> is not one"},
      {listOf("<data>AA==AAAA</data>"), "line 3: the content of <data> is not one"},
      {listOf("<data>AA==</data>\n<data>A*==</data>"), "line 4: "},
      {listOf("<data>A-AA</data>"), "line 3: the content of <data> is not one"},
      {listOf("<string>&nbsp;</string>"), "line 3: "},
      {listOf("<string>&#0;</string>"), "line 3: "},
      {listOf("<string>&#1;</string>"), "line 3: "},
      {listOf("<string>&#xFFFE;</string>"), "line 3: "},
      {listOf("<string>&#xD800;</string>"), "line 3: "},
      {listOf("<string>a\x01</string>"), "line 3: "},
      {listOf("<string>\xFF</string>"), "line 3: "},
      {listOf("<string>\xED\xA0\x80</string>"), "line 3: "},
      {listOf("<string>\xEF\xBF\xBF</string>"), "line 3: "},
      {"<!DOCTYPE plist [<!ENTITY a \"b\">]><plist version=\"1.0\"><string>&a;</string></plist>",
       "line 1: the document type has declarations of its own"},
      {"<!DOCTYPE plist [<!ENTITY % a \"b\">%a;]><plist version=\"1.0\"><true/></plist>",
       "line 1: the document type has declarations of its own"},
      {"<!DOCTYPE plist []><plist version=\"1.0\"><true/></plist>", "line 1: the document type has declarations of its own"},
      {"<!DOCTYPE plist SYSTEM \"x\">\n<plist version=\"1.0\"><string>&a;</string></plist>", "line 2: the entity \"a\" is not known"},
      {"<?xml version=\"1.0\" encoding=\"EBCDIC\"?><plist version=\"1.0\"><true/></plist>", "line 1: "},
      {listOf(times(kPropertyListMaximumDepth, "<array>") + times(kPropertyListMaximumDepth, "</array>")),
       "line 3: elements are nested too deeply"},
  };
  for (const Bad& bad : lists) {
    const auto result = parsed(bad.text);
    const auto* error = std::get_if<QXError>(&result);
    ASSERT_NE(error, nullptr) << bad.text << "\n" << std::get<QXValue>(result).description();
    EXPECT_EQ(error->domain, kQXGeneralErrorDomain) << bad.text;
    EXPECT_EQ(error->code, kNoPropertyListError) << bad.text;
    EXPECT_NE(error->texts.at("description").find("Not a property list: "), std::string::npos) << bad.text;
    EXPECT_NE(error->texts.at("description").find(bad.why), std::string::npos) << bad.text << "\n" << error->description();
  }
}

TEST(PropertyListParser, EveryBeginningOfAListIsRefused) {
  const std::string whole = listOf("<dict><key>a</key><array><string>b&amp;</string><data>AAEC</data></array></dict>");
  const std::size_t end = whole.rfind('>');
  for (std::size_t length = 0; length < end; ++length) {
    EXPECT_TRUE(std::holds_alternative<QXError>(parsed(whole.substr(0, length)))) << whole.substr(0, length);
  }
  EXPECT_TRUE(std::holds_alternative<QXValue>(parsed(whole.substr(0, end + 1))));
}

TEST(PropertyListParser, TakesElementsAsDeepAsTheLimit) {
  const std::size_t arrays = kPropertyListMaximumDepth - 1;  // with <plist> around them
  EXPECT_TRUE(std::holds_alternative<QXValue>(parsed(listOf(times(arrays, "<array>") + times(arrays, "</array>")))));
}

TEST(PropertyListParser, RefusesMoreElementsThanTheLimit) {
  const std::size_t values = kPropertyListMaximumElements - 2;  // besides <plist> and <array>
  EXPECT_TRUE(std::holds_alternative<QXValue>(parsed(listOf("<array>" + times(values, "<true/>") + "</array>"))));
  const auto result = parsed(listOf("<array>" + times(values + 1, "<true/>") + "</array>"));
  ASSERT_TRUE(std::holds_alternative<QXError>(result));
  EXPECT_NE(std::get<QXError>(result).description().find("too many elements"), std::string::npos);
}

TEST(PropertyListParser, TakesTheGreatestLengthAndNotAByteMore) {
  const std::size_t around = listOf("<string></string>").size();
  const auto ofLength = [around](std::size_t length) {
    return parsed(listOf("<string>" + std::string(length - around, 'x') + "</string>"));
  };
  EXPECT_TRUE(std::holds_alternative<QXValue>(ofLength(kPropertyListMaximumBytes)));
  const auto over = ofLength(kPropertyListMaximumBytes + 1);
  ASSERT_TRUE(std::holds_alternative<QXError>(over));
  EXPECT_NE(std::get<QXError>(over).description().find("the text is too long"), std::string::npos);
}

TEST(PropertyListParser, StopsReadingBeyondTheGreatestLength) {
  PropertyListParser parser;
  ASSERT_TRUE(parser.feed(std::string(kHead) + "<string>"));
  const std::string part(1U << 20U, 'x');
  std::size_t parts = 0;
  while (parser.feed(part)) ASSERT_LT(++parts, kPropertyListMaximumBytes / part.size());
  const auto result = parser.finish();
  ASSERT_TRUE(std::holds_alternative<QXError>(result));
  EXPECT_NE(std::get<QXError>(result).description().find("the text is too long"), std::string::npos);
}

}  // namespace
}  // namespace docuvend::linux_platform
