#include "tests/messages/catalogue/MessageScanner.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <stdexcept>

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

std::vector<std::string> textsIn(std::string_view source) {
  std::vector<std::string> texts;
  for (const ScannedMessage& message : messagesIn(source)) texts.push_back(message.text);
  return texts;
}

TEST(MessagesIn, AreTheLiteralsThatBeginWithALevel) {
  EXPECT_THAT(
      textsIn(R"(dvLog("[INFO] a"); dvLog("[NOTICE] b"); f("c", "[WARNING] d", "x [INFO] e"); dvLog("[DEBUG] f"); dvLog("[ERROR] g");)"),
      ElementsAre("[INFO] a", "[NOTICE] b", "[DEBUG] f", "[ERROR] g"));
}

TEST(MessagesIn, SayMoreThanTheirLevel) { EXPECT_THAT(textsIn(R"(if (text.starts_with("[INFO] ")) return info;)"), IsEmpty()); }

TEST(MessagesIn, HaveTheLineOnWhichTheyBegin) {
  EXPECT_EQ(messagesIn("\n  dvLog(\n\"[INFO] a \"\n\"b\");\n// c\ndvLog(\"[INFO] d\");"),
            (std::vector<ScannedMessage>{{"[INFO] a b", 3}, {"[INFO] d", 6}}));
}

TEST(MessagesIn, AreNotInComments) {
  EXPECT_THAT(textsIn("// dvLog(\"[INFO] a\");\n/* dvLog(\"[INFO] b\");\n*/ dvLog(/*format=*/\"[INFO] c\");"), ElementsAre("[INFO] c"));
}

TEST(MessagesIn, AreNotCutShortByQuotes) {
  EXPECT_THAT(textsIn(R"(f('"'); dvLog("[INFO] a \"b\" \\"); f('\'');)"), ElementsAre(R"([INFO] a "b" \)"));
  EXPECT_THAT(textsIn(R"(int a = 1'000; dvLog("[INFO] b"); f('a', 0x1'F);)"), ElementsAre("[INFO] b"));
  for (const char* source : {R"(dvLog("[INFO] a)", R"(dvLog("[INFO] a\")", "f('", "\""}) {
    EXPECT_THROW(textsIn(source), std::invalid_argument) << source;
  }
}

TEST(MessagesIn, HaveOneSignForAllKindsOfValues) {
  EXPECT_THAT(textsIn(R"(dvLog("[INFO] %@ %s %d", a.b(c, d), e<f>{g}, h ? i->j() : 0); Format k = "[ERROR] %d";)"),
              ElementsAre("[INFO] %@ %@ %@", "[ERROR] %@"));
}

TEST(MessagesIn, ContainTheLiteralsAmongTheirValues) {
  EXPECT_THAT(textsIn(R"(dvLog("[DEBUG] %s of %@: %@", "-[A b:c:]", d, "e"); dvLog("[DEBUG] %s", f("g")); dvLog("[DEBUG] %s", h + "i");)"),
              ElementsAre("[DEBUG] -[A b:c:] of %@: e", "[DEBUG] %@", "[DEBUG] %@"));
}

TEST(MessagesIn, AreEachTheirOwnInATable) {
  EXPECT_THAT(textsIn(R"(Row row{"name", "[ERROR] a %@", "[ERROR] b %@", [] { dvLog("[DEBUG] c"); }};)"),
              ElementsAre("[ERROR] a %@", "[ERROR] b %@", "[DEBUG] c"));
}

TEST(MessagesIn, AreFormatsWhateverFunctionTakesThemAndWhateverComesBefore) {
  EXPECT_THAT(
      textsIn(R"(qxLog(a.log(b, c), "[INFO] %@ %d", d, "e"); put(f(g), qxLogMessage("[ERROR] %s", h)); for (;;) { i("[DEBUG] j"); })"),
      ElementsAre("[INFO] %@ e", "[ERROR] %@", "[DEBUG] j"));
  EXPECT_THAT(textsIn(R"(f([] { k = {"[DEBUG] %d", 1}; }); (void)x; Format l = "[INFO] %s";)"), ElementsAre("[DEBUG] %@", "[INFO] %@"));
}

TEST(MessagesIn, AreRefusedWhenTheyArePutTogether) {
  for (const char* source : {R"(f("[INFO] a" + b);)", R"(f("[NOTICE] " + b);)", R"(std::string c = d + "[ERROR] e";)"}) {
    EXPECT_THROW(textsIn(source), std::invalid_argument) << source;
  }
  EXPECT_THAT(textsIn(R"(dvLog("[INFO] %@", "a" + b);)"), ElementsAre("[INFO] %@"));
}

TEST(MessagesIn, AreRefusedWithASourceThatWritesToTheLogWithoutAFormat) {
  for (const char* source :
       {"log.write(type, text);", "log_.write(type, text);", "a.log->write(type, text);", "platform.log.defaultLog().write(type, text);"}) {
    EXPECT_THROW(textsIn(source), std::invalid_argument) << source;
  }
  EXPECT_THAT(textsIn("stream.write(log); journal_->write(text); f(log); write(a);"), IsEmpty());
}

TEST(MessagesIn, AreRefusedWithAnotherNumberOfValuesThanPlaces) {
  EXPECT_THROW(textsIn(R"(dvLog("[INFO] %@");)"), std::invalid_argument);
  EXPECT_THROW(textsIn(R"(dvLog("[INFO] %@", a, b);)"), std::invalid_argument);
  EXPECT_THAT(textsIn(""), IsEmpty());
}

}  // namespace
}  // namespace docuvend::tests
