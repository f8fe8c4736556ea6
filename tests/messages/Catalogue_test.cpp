#include "tests/messages/catalogue/Catalogue.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sstream>

namespace docuvend::tests {
namespace {

using fake_platform::AssertedMessage;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Optional;

Catalogue catalogueOf(const std::vector<std::string>& messages) {
  Catalogue catalogue;
  for (const std::string& message : messages) catalogue.add("acl/A.cpp:1", message);
  return catalogue;
}

TEST(ValuesOf, AreWhatStandsInThePlacesOfTheMessage) {
  EXPECT_THAT(valuesOf("[INFO] a", "[INFO] a"), Optional(IsEmpty()));
  EXPECT_THAT(valuesOf("[INFO] a %@ c %@", "[INFO] a b c d"), Optional(ElementsAre("b", "d")));
  EXPECT_THAT(valuesOf("[INFO] a %@.", "[INFO] a b..."), Optional(ElementsAre("b..")));
  EXPECT_THAT(valuesOf("[INFO] “%@” %@", "[INFO] “” x"), Optional(ElementsAre("", "x")));
}

TEST(ValuesOf, AreNoneForAnotherText) {
  EXPECT_EQ(valuesOf("[INFO] a", "[INFO] ab"), std::nullopt);
  EXPECT_EQ(valuesOf("[INFO] %@.", "[INFO] a"), std::nullopt);
  EXPECT_EQ(valuesOf("[INFO] %@", "[DEBUG] a"), std::nullopt);
  EXPECT_EQ(valuesOf("[INFO] %@ b %@ c", "[INFO] a c"), std::nullopt);
  EXPECT_EQ(valuesOf("[INFO] aa%@aa", "[INFO] aaa"), std::nullopt) << "the ends do not overlap";
}

TEST(CatalogueTest, IsContentWhenEveryMessageIsAssertedAndNothingElse) {
  const auto findings =
      catalogueOf({"[INFO] a", "[ERROR] b %@"}).compare({{QXLogType::info, "[INFO] a"}, {QXLogType::fault, "[ERROR] b 1"}});
  EXPECT_TRUE(findings.areGood());
  EXPECT_EQ(findings.asserted, 2U);
}

TEST(CatalogueTest, NamesTheMessageThatNobodyAssertsAndItsPlace) {
  const auto findings = catalogueOf({"[INFO] a", "[ERROR] b"}).compare({{QXLogType::info, "[INFO] a"}});
  EXPECT_FALSE(findings.areGood());
  EXPECT_EQ(findings.asserted, 1U);
  EXPECT_THAT(findings.unasserted, ElementsAre("[ERROR] b\n    written by acl/A.cpp:1"));
}

TEST(CatalogueTest, NamesTheAssertionOfWhatNobodyWrites) {
  const auto findings = catalogueOf({"[INFO] a"}).compare({{QXLogType::info, "[INFO] a"}, {QXLogType::info, "[INFO] b"}});
  EXPECT_THAT(findings.unknown, ElementsAre("no source writes: [INFO] b"));
  EXPECT_FALSE(findings.areGood());
}

TEST(CatalogueTest, AnAssertionAtAnotherTypeThanTheLevelsIsNone) {
  const auto findings = catalogueOf({"[INFO] a"}).compare({{QXLogType::fault, "[INFO] a"}});
  EXPECT_THAT(findings.unknown, ElementsAre("at another type than its level's: [INFO] a"));
  EXPECT_EQ(findings.unasserted.size(), 1U);
}

TEST(CatalogueTest, EveryPlaceNeedsAValueOfItsOwn) {
  const Catalogue catalogue = catalogueOf({"[INFO] %@ to %@"});
  for (const char* text : {"[INFO] a to a", "[INFO]  to b", "[INFO] (null) to b"}) {
    const auto findings = catalogue.compare({{QXLogType::info, text}});
    EXPECT_THAT(findings.unasserted, ElementsAre(HasSubstr(std::string("asserted only as ") + text)));
  }
  EXPECT_TRUE(catalogue.compare({{QXLogType::info, "[INFO] (null) to b"}, {QXLogType::info, "[INFO] a to b"}}).areGood());
}

TEST(CatalogueTest, ATextBelongsToTheMessageThatSaysMostOfIt) {
  const Catalogue catalogue = catalogueOf({"[DEBUG] %@", "[DEBUG] Serving: %@"});
  const auto findings = catalogue.compare({{QXLogType::debug, "[DEBUG] Serving: x"}});
  EXPECT_THAT(findings.unasserted, ElementsAre(HasSubstr("[DEBUG] %@")));
  EXPECT_TRUE(catalogue.compare({{QXLogType::debug, "[DEBUG] Serving: x"}, {QXLogType::debug, "[DEBUG] x"}}).areGood());
}

TEST(CatalogueTest, ReadsWhatItWroteWithAllPlacesOfAText) {
  Catalogue catalogue;
  catalogue.add("acl/A.cpp:1", "[INFO] a");
  catalogue.add("acl/B.cpp:22", "[INFO] a");
  catalogue.add("acl/B.cpp:23", "[INFO] b: %@");
  std::stringstream file;
  catalogue.write(file);
  const Catalogue read = Catalogue::from(file);
  EXPECT_EQ(read.size(), 2U);
  EXPECT_THAT(read.compare({}).unasserted, ElementsAre("[INFO] a\n    written by acl/A.cpp:1\n    written by acl/B.cpp:22",
                                                       "[INFO] b: %@\n    written by acl/B.cpp:23"));
}

}  // namespace
}  // namespace docuvend::tests
