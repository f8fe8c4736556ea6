#include "tools/docuvendctl/PlainText.h"

#include <gtest/gtest.h>

#include <string>

#include "tests/tools/Answers.h"

namespace docuvend::ctl {
namespace {

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
  EXPECT_EQ(plainText(Record{{{"a", kNested}}}), "a.list\tone\na.list\t2\na.list.3.key\tvalue\na.number\t3\n");
}

TEST(PlainText, NothingIsCut) {
  const std::string text(100'000, 'x');
  EXPECT_EQ(plainText(List{{"a"}, {{text}}}), text + "\n");
}

TEST(PlainText, ValuesAreWrittenAsPeopleReadThem) {
  EXPECT_EQ(plainText(List{{"a"}, {{true}, {false}, {-7}, {QXValue()}, {*QXURL::fromString("file:///d/")}}}),
            "true\nfalse\n-7\nunknown\nfile:///d/\n");
}

}  // namespace
}  // namespace docuvend::ctl
