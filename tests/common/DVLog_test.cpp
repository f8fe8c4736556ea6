#include "common/DVLog.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

using fake_platform::FakeLogEntry;
using fake_platform::FakeLogSwitch;
using testing::ElementsAre;
using testing::IsEmpty;

// Counts how often it is asked to describe itself.
struct SelfDescribing {
  [[nodiscard]] std::string description() const {
    ++described;
    return "itself";
  }
  mutable int described = 0;
};

class DVLogTest : public testing::Test {
 protected:
  [[nodiscard]] std::vector<FakeLogEntry> entries() const { return platform.log.entries(); }

  fake_platform::FakePlatform platform;
};

TEST_F(DVLogTest, TheLevelAtTheBeginningOfAMessageDecidesItsType) {
  dvLog("[NOTICE] a");
  dvLog("[INFO] b");
  dvLog("[DEBUG] c");
  dvLog("[ERROR] d");
  EXPECT_THAT(entries(), ElementsAre(FakeLogEntry{QXLogType::defaultType, "[NOTICE] a"}, FakeLogEntry{QXLogType::info, "[INFO] b"},
                                     FakeLogEntry{QXLogType::debug, "[DEBUG] c"}, FakeLogEntry{QXLogType::fault, "[ERROR] d"}));
}

TEST_F(DVLogTest, TheDefaultLogIsThePlatforms) { EXPECT_EQ(&dv_default_log(), &platform.log.defaultLog()); }

TEST_F(DVLogTest, PlaceholdersAreReplacedInOrder) {
  dvLog("[INFO] %s handles %@ with %d tries left, %@.", "-[Class operation:]", ProviderID{"com.example.provider"}, 3, std::string("text"));
  EXPECT_THAT(platform.log.texts(), ElementsAre("[INFO] -[Class operation:] handles com.example.provider with 3 tries left, text."));
}

TEST_F(DVLogTest, OfALongValueTheBeginningIsShown) {
  const std::string whole(kDVLongestLoggedValue, 'a');
  dvLog("[NOTICE] %@ is not %@", whole, whole + "b");
  // A character that the limit would divide is left out.
  dvLog("[NOTICE] %@", whole.substr(1) + "é");
  dvLog("[NOTICE] %@", ItemID{whole.substr(2) + "é"});
  EXPECT_THAT(platform.log.texts(), ElementsAre("[NOTICE] " + whole + " is not " + whole + "…", "[NOTICE] " + whole.substr(1) + "…",
                                                "[NOTICE] " + whole.substr(2) + "é"));
}

TEST_F(DVLogTest, OfALongValueInWhichNoCharacterBeginsNothingIsShown) {
  dvLog("[NOTICE] %@", std::string(kDVLongestLoggedValue + 1, '\x80'));
  EXPECT_THAT(platform.log.texts(), ElementsAre("[NOTICE] …"));
}

TEST_F(DVLogTest, AbsentValuesPrintAsNull) {
  dvLog("[INFO] %@ %@ %@ %@", std::optional<std::string>(), std::optional<QXError>(), std::optional<QXURL>(),
        std::shared_ptr<SelfDescribing>());
  EXPECT_THAT(platform.log.texts(), ElementsAre("[INFO] (null) (null) (null) (null)"));
}

TEST_F(DVLogTest, PresentOptionalValuesPrintAsTheValue) {
  dvLog("[INFO] %@ %@", std::optional<std::string>("text"), std::make_shared<SelfDescribing>());
  EXPECT_THAT(platform.log.texts(), ElementsAre("[INFO] text itself"));
}

TEST_F(DVLogTest, ValuesAreNotFormatsAndOtherPercentSignsStay) {
  dvLog("[INFO] 100% of %@ and %@ %x%", "%@ %d", "second");
  EXPECT_THAT(platform.log.texts(), ElementsAre("[INFO] 100% of %@ %d and second %x%"));
}

TEST_F(DVLogTest, AMessageOfATypeThatIsOffIsNeitherFormattedNorWritten) {
  platform.log.setEnabled(QXLogType::debug, FakeLogSwitch::off);
  platform.log.setEnabled(QXLogType::info, FakeLogSwitch::off);
  const auto thing = std::make_shared<SelfDescribing>();
  dvLog("[DEBUG] %@", thing);
  dvLog("[INFO] %@", thing);
  EXPECT_EQ(thing->described, 0);
  EXPECT_EQ(platform.log.writes(), 0u);
  EXPECT_THAT(entries(), IsEmpty());
  dvLog("[ERROR] %@", thing);
  EXPECT_EQ(thing->described, 1);
  EXPECT_EQ(platform.log.writes(), 1u);
}

}  // namespace
}  // namespace docuvend
