#include "tools/docuvendctl/AnswerText.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <nlohmann/json.hpp>
#include <sstream>

#include "tools/docuvendctl/TextWidth.h"

namespace docuvend::ctl {
namespace {

constexpr std::size_t kWide = 200;

const List kGrants{{"provider", "item", "consumer"}, {{"org.p", "1", "org.c"}, {"org.provider", "22", "org.cc"}}};
const List kEmpty{{"provider", "item"}, {}};
const Record kRecord{{{"url", QXValue(*QXURL::fromString("file:///x%20y"))}, {"token", QXValue("docuvend-token:1")}}};

QXValue nested() { return QXDictionary{{"list", QXArray{"one", 2, QXDictionary{{"key", "value"}}}}, {"number", 3}, {"empty", QXArray{}}}; }

std::vector<std::string> linesOf(const std::string& text) {
  std::vector<std::string> lines;
  std::istringstream stream(text);
  for (std::string line; std::getline(stream, line);) lines.push_back(line);
  return lines;
}

TEST(PlainText, ALineIsTheTextItself) { EXPECT_EQ(plainText(Line{"string", "docuvend:p/a\tb\\"}), "docuvend:p/a\tb\\\n"); }

TEST(PlainText, NothingIsNothing) { EXPECT_EQ(plainText(Nothing{}), ""); }

TEST(PlainText, APageStaysAsItIs) { EXPECT_EQ(plainText(Page{"help", "a\n  b\n"}), "a\n  b\n"); }

TEST(PlainText, AListIsOneLineForEachRowAndHasNoHeader) {
  EXPECT_EQ(plainText(kGrants), "org.p\t1\torg.c\norg.provider\t22\torg.cc\n");
  EXPECT_EQ(plainText(kEmpty), "");
}

TEST(PlainText, ARecordIsOneLineForEachFieldAlsoWhenThereIsOnlyOne) {
  EXPECT_EQ(plainText(kRecord), "url\tfile:///x%20y\ntoken\tdocuvend-token:1\n");
  EXPECT_EQ(plainText(Record{{{"url", QXValue("x")}}}), "url\tx\n");
}

TEST(PlainText, AListInARecordIsALineForEachRowBehindItsName) {
  EXPECT_EQ(plainText(Record{{{"bundle", QXValue("b")}, {"grants", kGrants}, {"none", kEmpty}}}),
            "bundle\tb\ngrants\torg.p\t1\torg.c\ngrants\torg.provider\t22\torg.cc\n");
}

TEST(PlainText, NoValueCanForgeALineOrAColumn) {
  const List list{{"a", "b"}, {{"x\ty", "1\n2\r3\\n"}, {"", ""}}};
  EXPECT_EQ(plainText(list), "x\\ty\t1\\n2\\r3\\\\n\n\t\n");
  EXPECT_EQ(plainText(Record{{{"na\tme", QXValue("x\ny")}}}), "na\\tme\tx\\ny\n");
}

TEST(PlainText, WhatIsNestedGetsTheNamesOfWhatItLiesIn) {
  EXPECT_EQ(plainText(Record{{{"a", nested()}}}), "a.list\tone\na.list\t2\na.list.3.key\tvalue\na.number\t3\n");
}

TEST(PlainText, NothingIsCut) {
  const std::string text(100'000, 'x');
  EXPECT_EQ(plainText(List{{"a"}, {{text}}}), text + "\n");
}

TEST(PlainText, ValuesAreWrittenAsPeopleReadThem) {
  EXPECT_EQ(plainText(List{{"a"}, {{true}, {false}, {-7}, {QXValue()}, {*QXURL::fromString("file:///d/")}}}),
            "true\nfalse\n-7\nunknown\nfile:///d/\n");
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

TEST(JSONText, EveryAnswerIsOneLineOfOneValue) {
  const std::vector<std::pair<Answer, std::string>> table = {
      {Nothing{}, "{}"},
      {Line{"string", "docuvend:p/\"\n"}, R"({"string":"docuvend:p/\"\n"})"},
      {Page{"help", "a\nb\n"}, R"({"help":"a\nb\n"})"},
      {kEmpty, "[]"},
      {kGrants, R"([{"provider":"org.p","item":"1","consumer":"org.c"},{"provider":"org.provider","item":"22","consumer":"org.cc"}])"},
      {kRecord, R"({"url":"file:///x%20y","token":"docuvend-token:1"})"},
      {Record{}, "{}"},
      {Record{{{"bundle", QXValue("b")}, {"grants", kEmpty}, {"unknown", QXValue()}}}, R"({"bundle":"b","grants":[],"unknown":null})"},
      {Record{{{"a", nested()}}}, R"({"a":{"empty":[],"list":["one",2,{"key":"value"}],"number":3}})"},
      {List{{"v"}, {{true}, {-7}, {1.5}, {QXValue()}}}, R"([{"v":true},{"v":-7},{"v":1.5},{"v":null}])"},
      {Line{"string", "\xff"}, "{\"string\":\"\ufffd\"}"},
      {Record{{{"data", QXValue(QXData::fromText("ab"))}}}, R"({"data":"<2 bytes>"})"},
  };
  for (const auto& [answer, expected] : table) {
    EXPECT_EQ(jsonText(answer), expected + "\n");
    EXPECT_FALSE(nlohmann::json::parse(jsonText(answer), nullptr, /*allow_exceptions=*/false).is_discarded()) << expected;
  }
}

TEST(JSONText, AnErrorIsAnObjectWithDomainCodeAndDescription) {
  EXPECT_EQ(jsonText(QXError::make("D", 7, "no \"x\"")),
            "{\"error\":{\"domain\":\"D\",\"code\":7,\"description\":\"D 7: no \\\"x\\\"\"}}\n");
}

TEST(JSONText, AStringIsQuoted) { EXPECT_EQ(jsonString("a\"\\\n"), R"("a\"\\\n")"); }

}  // namespace
}  // namespace docuvend::ctl
