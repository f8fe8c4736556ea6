#include "tools/docuvendctl/JSONText.h"

#include <gtest/gtest.h>

#include <utility>
#include <vector>

namespace docuvend::ctl {
namespace {

TEST(JSONText, AStringIsOneLineOfValidJSON) {
  const std::vector<std::pair<std::string, std::string>> table = {
      {"", R"("")"},
      {"plain", R"("plain")"},
      {"/a\"b\\c", R"("/a\"b\\c")"},
      {"1\n2\r3\t4", R"("1\n2\r3\t4")"},
      {std::string("\0\x01\x1f\x7f", 4), R"("\u0000\u0001\u001f\u007f")"},
      {"“é” 😀", R"("“é” 😀")"},
      {"\xff", "\"\xEF\xBF\xBD\""},
      {"a\xC3", "\"a\xEF\xBF\xBD\""},
      {"\xC3(", "\"\xEF\xBF\xBD(\""},
      {"\xED\xA0\x80", "\"\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD\""},
      {"\xC0\xAF", "\"\xEF\xBF\xBD\xEF\xBF\xBD\""},
  };
  for (const auto& [text, expected] : table) EXPECT_EQ(jsonString(text), expected);
}

TEST(JSONText, AnObjectKeepsItsMembersOrder) {
  JSONObject inner;
  inner.add("code", std::int64_t{-7});
  JSONObject object;
  EXPECT_EQ(object.text(), "{}");
  object.add("z\"", "1");
  object.add("a", inner);
  EXPECT_EQ(object.text(), R"({"z\"":"1","a":{"code":-7}})");
}

}  // namespace
}  // namespace docuvend::ctl
