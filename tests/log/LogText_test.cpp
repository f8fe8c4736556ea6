#include "platform/linux/log/LogText.h"

#include <gtest/gtest.h>

#include <string>
#include <string_view>

#include "platform/QXURL.h"

namespace docuvend::linux_platform {
namespace {

using namespace std::string_view_literals;

struct Row {
  std::string_view text;
  std::string_view expected;
};

TEST(LogText, ShowsWhatCouldForgeALineOrDisturbATerminalAndLeavesTheRest) {
  const Row rows[] = {
      {"", ""},
      {"[NOTICE] plain text, 100 % \"quoted\"", "[NOTICE] plain text, 100 % \"quoted\""},
      {"caf\u00e9 \u2603 \U0001F600", "caf\u00e9 \u2603 \U0001F600"},
      {"back\\slash \\n stays", "back\\slash \\n stays"},
      {"a\nb", "a\\nb"},
      {"a\r\nb\t", "a\\r\\nb\\t"},
      {"\x1b[31mred\x07", "\\x1b[31mred\\x07"},
      {"nul\0here"sv, "nul\\x00here"},
      {"\x1f|\x20|\x7e|\x7f", "\\x1f| |~|\\x7f"},
      {"\u0080\u0085\u009b\u009f\u00a0", "\\u{80}\\u{85}\\u{9b}\\u{9f}\u00a0"},
      {"\u2027\u2028\u2029\u202f", "\u2027\\u{2028}\\u{2029}\u202f"},
      {"\u200d\u200e\u200f\u2010", "\u200d\\u{200e}\\u{200f}\u2010"},
      {"\u202a\u202b\u202c\u202d\u202e", "\\u{202a}\\u{202b}\\u{202c}\\u{202d}\\u{202e}"},
      {"\u2065\u2066\u2067\u2068\u2069\u206a", "\u2065\\u{2066}\\u{2067}\\u{2068}\\u{2069}\u206a"},
      {"\u061b\u061c\u061d", "\u061b\\u{61c}\u061d"},
      {"\x80", "\\x80"},
      {"\xff\xfe", "\\xff\\xfe"},
      {"cut \xe2\x98", "cut \\xe2\\x98"},
      {"\xe2\x98\n", "\\xe2\\x98\\n"},
      {"overlong \xc0\x8a", "overlong \\xc0\\x8a"},
      {"surrogate \xed\xa0\x80", "surrogate \\xed\\xa0\\x80"},
      {"beyond \xf4\x90\x80\x80", "beyond \\xf4\\x90\\x80\\x80"},
      {"\xc3\xa9\xc3", "\u00e9\\xc3"},
  };
  for (const Row& row : rows) {
    EXPECT_EQ(visibleLogText(row.text), row.expected) << "for \"" << row.expected << "\"";
    EXPECT_EQ(visibleText(row.text), row.expected) << "for \"" << row.expected << "\"";
  }
}

TEST(LogText, ShowsALongTextUpToTheBoundWhole) {
  const std::string text(kLongestLogText, 'a');
  EXPECT_EQ(visibleLogText(text), text);
}

TEST(LogText, CutsALongerTextAndSaysWhatIsMissing) {
  const std::string text(kLongestLogText + 100, 'a');
  EXPECT_EQ(visibleLogText(text), std::string(kLongestLogText, 'a') + "... [100 more bytes]");
  EXPECT_EQ(visibleText(text), text);
}

TEST(LogText, CutsBetweenCharactersAndNeverInsideAnEscape) {
  for (std::size_t offset = 0; offset < 8; ++offset) {
    std::string wide(offset, 'a');
    std::string controls(offset, 'a');
    for (int i = 0; i < 2000; ++i) wide += "\u2603";
    controls.append(2000, '\x1b');
    const std::string shownWide = visibleLogText(wide);
    EXPECT_TRUE(qxIsValidUTF8(shownWide));
    const std::string shown = visibleLogText(controls);
    const std::size_t end = shown.find("...");
    ASSERT_NE(end, std::string::npos);
    EXPECT_LE(end, kLongestLogText);
    EXPECT_GT(end, kLongestLogText - 4);
    EXPECT_EQ((end - offset) % 4, 0u);
    EXPECT_EQ(shown.substr(end), "... [" + std::to_string(controls.size() - offset - (end - offset) / 4) + " more bytes]");
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
