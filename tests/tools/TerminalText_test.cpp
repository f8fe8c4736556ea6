#include "tools/docuvendctl/TerminalText.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sstream>
#include <string>
#include <vector>

#include "tests/tools/Answers.h"
#include "tools/docuvendctl/TextWidth.h"

namespace docuvend::ctl {
namespace {

constexpr std::size_t kWide = 200;

std::vector<std::string> linesOf(const std::string& text) {
  std::vector<std::string> lines;
  std::istringstream stream(text);
  for (std::string line; std::getline(stream, line);) lines.push_back(line);
  return lines;
}

TEST(TerminalText, AListIsATableWithAlignedColumnsAndAHeader) {
  EXPECT_EQ(terminalText(kGrants, kWide),
            "PROVIDER      ITEM  CONSUMER\n"
            "org.p         1     org.c\n"
            "org.provider  22    org.cc\n");
}

TEST(TerminalText, AnEmptyListIsItsHeader) { EXPECT_EQ(terminalText(kEmpty, kWide), "PROVIDER  ITEM\n"); }

TEST(TerminalText, WideAndCombiningCharactersDoNotBreakColumns) {
  const List list{{"a", "b"}, {{"\u6f22\u5b57", "1"}, {"e\u0301", "2"}, {"abc", "3"}}};
  EXPECT_EQ(terminalText(list, kWide), "A     B\n\u6f22\u5b57  1\ne\u0301     2\nabc   3\n");
}

TEST(TerminalText, WhatWouldSteerTheTerminalIsMadeVisible) {
  const std::string bad = "\x1b[31m\n\t\xff\u202e";
  const std::string good = "\\x1b[31m\\n\\t\\xff\\u{202e}";
  EXPECT_EQ(terminalText(List{{"a"}, {{bad}}}, kWide), "A\n" + good + "\n");
  EXPECT_EQ(terminalText(Record{{{bad, QXValue(bad)}}}, kWide), good + "  " + good + "\n");
  EXPECT_EQ(terminalText(Line{"string", bad}, kWide), good + "\n");
}

TEST(TerminalText, ATableThatIsTooWideTakesItFromItsWidestColumns) {
  const List list{{"short", "long"}, {{"abc", std::string(50, 'x')}, {"defgh", "y"}}};
  const auto lines = linesOf(terminalText(list, 30));
  EXPECT_THAT(lines, ::testing::ElementsAre("SHORT  LONG", "abc    " + std::string(22, 'x') + "\u2026", "defgh  y"));
  for (const auto& line : lines) EXPECT_LE(textWidth(line), 30U);
  // Two wide ones share the loss.
  const List both{{"a", "b"}, {{std::string(30, 'x'), std::string(30, 'y')}}};
  EXPECT_EQ(linesOf(terminalText(both, 22))[1], std::string(9, 'x') + "\u2026  " + std::string(9, 'y') + "\u2026");
}

TEST(TerminalText, ATableThatFitsExactlyIsWhole) {
  const List list{{"a", "b"}, {{std::string(10, 'x'), std::string(10, 'y')}}};
  EXPECT_EQ(linesOf(terminalText(list, 22))[1], std::string(10, 'x') + "  " + std::string(10, 'y'));
}

TEST(TerminalText, AVeryNarrowTerminalFoldsLinesInsteadOfLosingColumns) {
  const auto lines = linesOf(terminalText(List{{"a", "b"}, {{std::string(40, 'x'), std::string(40, 'y')}}}, 5));
  EXPECT_EQ(lines[1], std::string(7, 'x') + "\u2026  " + std::string(7, 'y') + "\u2026");
}

TEST(TerminalText, ARecordsNamesAreAlignedAndItsValuesWhole) {
  const std::string token(5000, 't');
  EXPECT_EQ(terminalText(Record{{{"url", QXValue("file:///x")}, {"siblingToken", QXValue(token)}}}, 20),
            "url           file:///x\nsiblingToken  " + token + "\n");
}

TEST(TerminalText, AListInARecordNamesItselfOnceAndSaysWhenItIsEmpty) {
  EXPECT_EQ(terminalText(Record{{{"bundle", QXValue("b")}, {"grants", kGrants}, {"none", kEmpty}}}, kWide),
            "bundle  b\n"
            "grants  org.p         1   org.c\n"
            "        org.provider  22  org.cc\n"
            "none    none\n");
}

TEST(TerminalText, APageStaysAsItIs) { EXPECT_EQ(terminalText(Page{"help", "a\n  b\n"}, 2), "a\n  b\n"); }

}  // namespace
}  // namespace docuvend::ctl
