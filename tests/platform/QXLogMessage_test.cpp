#include "platform/QXLogMessage.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <array>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/fake/FakeLog.h"

namespace docuvend {
namespace {

using fake_platform::FakeLog;
using fake_platform::FakeLogEntry;
using fake_platform::FakeLogSwitch;
using testing::ElementsAre;

// Counts how often it is asked to describe itself.
struct SelfDescribing {
  [[nodiscard]] std::string description() const {
    ++described;
    return "itself";
  }
  mutable int described = 0;
};

TEST(QXLogMessageTest, HasTheTypeOfItsLevelAndItsValuesInTheirPlaces) {
  const QXLogMessage message = qxLogMessage("[NOTICE] %s handles %@ with %d tries left, %@.", "operation", std::string("it"), 3, 4096UL);
  EXPECT_EQ(message.type, QXLogType::defaultType);
  EXPECT_EQ(message.text, "[NOTICE] operation handles it with 3 tries left, 4096.");
}

TEST(QXLogMessageTest, IsWrittenAtTheTypeOfItsLevel) {
  FakeLog log;
  qxLog(log.defaultLog(), "[NOTICE] a");
  qxLog(log.defaultLog(), "[INFO] %@", "b");
  qxLog(log.defaultLog(), "[DEBUG] c");
  qxLog(log.defaultLog(), "[ERROR] d %d", -1);
  EXPECT_THAT(log.entries(), ElementsAre(FakeLogEntry{QXLogType::defaultType, "[NOTICE] a"}, FakeLogEntry{QXLogType::info, "[INFO] b"},
                                         FakeLogEntry{QXLogType::debug, "[DEBUG] c"}, FakeLogEntry{QXLogType::fault, "[ERROR] d -1"}));
}

TEST(QXLogMessageTest, IsNotMadeWhenItsTypeIsOff) {
  FakeLog log;
  log.setEnabled(QXLogType::info, FakeLogSwitch::off);
  const auto thing = std::make_shared<SelfDescribing>();
  qxLog(log.defaultLog(), "[INFO] %@", thing);
  EXPECT_EQ(thing->described, 0);
  EXPECT_EQ(log.writes(), 0U);
  qxLog(log.defaultLog(), "[DEBUG] %@", thing);
  EXPECT_THAT(log.texts(), ElementsAre("[DEBUG] itself"));
}

TEST(QXLogMessageTest, ShowsLongValuesWhole) {
  const std::string value(5000, 'a');
  EXPECT_EQ(qxLogMessage("[INFO] %@.", value).text, "[INFO] " + value + ".");
}

TEST(QXTypeOfLevelTest, IsThatOfTheLevelThatTheTextBeginsWith) {
  EXPECT_EQ(qxTypeOfLevel("[NOTICE] a"), QXLogType::defaultType);
  EXPECT_EQ(qxTypeOfLevel("[INFO] a"), QXLogType::info);
  EXPECT_EQ(qxTypeOfLevel("[DEBUG] a"), QXLogType::debug);
  EXPECT_EQ(qxTypeOfLevel("[ERROR] a"), QXLogType::fault);
  for (const char* text : {"", "a", " [INFO] a", "[INFO]a", "[WARNING] a"}) EXPECT_EQ(qxTypeOfLevel(text), std::nullopt) << text;
}

TEST(QXDescribeTest, GivesEachValueTypeItsForm) {
  QXUUID uuid;
  for (std::size_t i = 0; i < uuid.bytes.size(); ++i) uuid.bytes[i] = static_cast<std::uint8_t>(i * 16 + i);
  const QXURL url = QXURL::fileURL("/a b", QXURLKind::directory);
  const std::array<std::string_view, 2> list = {"one", "two"};
  EXPECT_EQ(qxDescribe(-12), "-12");
  EXPECT_EQ(qxDescribe(std::string_view("view")), "view");
  EXPECT_EQ(qxDescribe(url), "file:///a%20b/");
  EXPECT_EQ(qxDescribe(uuid), "00112233-4455-6677-8899-AABBCCDDEEFF");
  EXPECT_EQ(qxDescribe(ProviderID{"provider"}), "provider");
  EXPECT_EQ(qxDescribe(ItemID{"item"}), "item");
  EXPECT_EQ(qxDescribe(ConsumerID{"consumer"}), "consumer");
  EXPECT_EQ(qxDescribe(QXError::make("Domain", 4, "What happened.")), "Domain 4: What happened.");
  EXPECT_EQ(qxDescribe(QXDictionary{{"key", 1}, {"other", "text"}}), "{\"key\" = 1, \"other\" = \"text\"}");
  EXPECT_EQ(qxDescribe(std::span<const std::string_view>(list)), "(\"one\", \"two\")");
  EXPECT_EQ(qxDescribe(std::span<const std::string_view>()), "()");
}

TEST(QXDescribeTest, GivesAnAbsentValueAsNullAndAPresentOneAsItself) {
  EXPECT_EQ(qxDescribe(std::optional<std::string>()), "(null)");
  EXPECT_EQ(qxDescribe(std::optional<QXURL>()), "(null)");
  EXPECT_EQ(qxDescribe(std::shared_ptr<SelfDescribing>()), "(null)");
  EXPECT_EQ(qxDescribe(std::optional<std::string>("text")), "text");
  EXPECT_EQ(qxDescribe(std::make_shared<SelfDescribing>()), "itself");
}

TEST(QXFormatTest, TakesValuesForNoFormatsAndLeavesOtherPercentSigns) {
  const std::array<std::string, 2> values = {"%@ %d", "second"};
  EXPECT_EQ(qxFormat("100% of %@ and %s %x%", values), "100% of %@ %d and second %x%");
}

TEST(QXFormatTest, KeepsThePlacesThatThereAreNoValuesFor) {
  const std::array<std::string, 1> values = {"one"};
  EXPECT_EQ(qxFormat("%@ %s %d", values), "one %s %d");
  EXPECT_EQ(qxFormat("%", values), "%");
  EXPECT_EQ(qxFormat("", values), "");
}

}  // namespace
}  // namespace docuvend
