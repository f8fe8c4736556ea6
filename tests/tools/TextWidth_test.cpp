#include "tools/docuvendctl/TextWidth.h"

#include <gtest/gtest.h>

#include <vector>

namespace docuvend::ctl {
namespace {

TEST(TextWidth, CountsColumnsNotBytes) {
  const std::vector<std::pair<std::string, std::size_t>> table = {
      {"", 0},
      {"abc", 3},
      {"\u00e9", 1},
      {"e\u0301", 1},       // a combining mark takes none
      {"\u6f22\u5b57", 4},  // East Asian
      {"a\u6f22b", 4},
      {"\U0001F4C4", 2},  // a page, beyond the basic plane
      {"\U00010348", 1},
      {"\u20ac", 1},
  };
  for (const auto& [text, width] : table) EXPECT_EQ(textWidth(text), width) << text;
}

TEST(TextWidth, CutsWhatIsTooWideBetweenCharacters) {
  struct Row {
    std::string text;
    std::size_t width;
    std::string expected;
  };
  const std::vector<Row> table = {
      {"abc", 3, "abc"},
      {"abc", 4, "abc"},
      {"abcd", 3, "ab\u2026"},
      {"abcd", 1, "\u2026"},
      {"abcd", 0, ""},
      {"", 0, ""},
      {"\u6f22\u5b57", 4, "\u6f22\u5b57"},
      {"\u6f22\u5b57", 3, "\u6f22\u2026"},
      {"\u6f22\u5b57", 2, "\u2026"},                  // half a character is none
      {"e\u0301e\u0301e\u0301", 2, "e\u0301\u2026"},  // a mark stays with its letter
  };
  for (const Row& row : table) {
    EXPECT_EQ(cutToWidth(row.text, row.width), row.expected) << row.text << " to " << row.width;
    EXPECT_LE(textWidth(cutToWidth(row.text, row.width)), row.width);
  }
}

TEST(TextWidth, FillsWhatIsNarrower) {
  EXPECT_EQ(filledToWidth("ab", 4), "ab  ");
  EXPECT_EQ(filledToWidth("abcd", 4), "abcd");
  EXPECT_EQ(filledToWidth("abcde", 4), "abcde");
  EXPECT_EQ(filledToWidth("\u6f22", 4), "\u6f22  ");
}

}  // namespace
}  // namespace docuvend::ctl
