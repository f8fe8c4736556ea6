#include "platform/linux/extension_host/OutputLines.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace docuvend::linux_platform {
namespace {

struct Case {
  const char* name;
  std::vector<std::string> chunks;
  std::vector<std::string> lines;
};

TEST(OutputLines, CutsWhatComesIntoLines) {
  const std::string longest(OutputLines::kLongestLine, 'x');
  const std::vector<Case> cases = {
      {"one line", {"abc\n"}, {"abc"}},
      {"two in one chunk", {"abc\ndef\n"}, {"abc", "def"}},
      {"a line in three chunks", {"a", "b", "c\n"}, {"abc"}},
      {"empty lines are dropped", {"\n\na\n\n"}, {"a"}},
      {"the last line needs no end", {"a\nb"}, {"a", "b"}},
      {"nothing", {}, {}},
      {"the longest line", {longest + "\n"}, {longest}},
      {"what is too long is dropped up to the end of the line", {longest + "yyy", "zzz\nnext\n"}, {longest, "next"}},
      {"no UTF-8",
       {"a\xFF\xFE!\n"},
       {"a?"
        "?!"}},
      {"UTF-8 over two chunks", {"\xC3", "\xA4\n"}, {"\xC3\xA4"}},
      {"a character that the limit cuts goes as a whole", {longest.substr(2) + "\xE2\x82\xAC\n"}, {longest.substr(2)}},
      {"a character that just fits stays", {longest.substr(3) + "\xE2\x82\xAC\n"}, {longest.substr(3) + "\xE2\x82\xAC"}},
  };
  for (const Case& test : cases) {
    std::vector<std::string> lines;
    OutputLines output([&lines](const std::string& line) { lines.push_back(line); });
    for (const std::string& chunk : test.chunks) output.add(chunk);
    output.finish();
    EXPECT_EQ(lines, test.lines) << test.name;
  }
}

TEST(OutputLines, ALineIsGivenOnWhenItEndsAndNotBefore) {
  std::vector<std::string> lines;
  OutputLines output([&lines](const std::string& line) { lines.push_back(line); });
  output.add("abc");
  EXPECT_TRUE(lines.empty());
  output.add("\n");
  EXPECT_EQ(lines.size(), 1U);
}

}  // namespace
}  // namespace docuvend::linux_platform
