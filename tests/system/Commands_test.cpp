// docuvendctl's commands over the real daemon: what they print, and the status for each kind of failure.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using ::testing::HasSubstr;
using ::testing::MatchesRegex;
using ::testing::StartsWith;

class Commands : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    for (const auto& bundle : {kCellar, kPicker, kStranger}) house_.install(bundle);
    house_.installTrickster();
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
    house_.startDaemon();
  }

  std::string letter_;
};

TEST_F(Commands, EachKindOfFailureHasAStatusOfItsOwnAndOneLine) {
  const std::vector<std::pair<std::vector<std::string>, int>> table = {
      {{"--as", kStranger, "grant", letter_, kCellar, kStranger}, 3},
      {{"providers"}, 3},
      {{"--as", kPicker, "start", letter_, kCellar, kPicker}, 3},
      {{"--as", kPicker, "cat", "docuvend:com.orvane.cellar/none"}, 3},
      {{"--as", kPicker, "grant", letter_, "com.example.none", kPicker}, 4},
      {{"--as", kPicker, "start", "/etc/passwd", kCellar, kPicker}, 4},
      {{"bookmark", "/etc/passwd"}, 4},
      {{"--as", kPicker, "grant", house_.document("none"), kCellar, kPicker}, 5},
      {{"--as", kPicker, "start", letter_, kTrickster, kPicker}, 6},
      {{"--as", kPicker, "resolve", "docuvend:"}, 6},
      {{"bookmark", "https://example.com/"}, 6},
      {{"bookmark", "relative"}, 6},
  };
  for (const auto& [arguments, status] : table) {
    const Ending ending = house_.ctl(arguments);
    const std::string shown = ::testing::PrintToString(arguments);
    EXPECT_EQ(ending.status, status) << shown << ending.errors;
    EXPECT_EQ(ending.output, "") << shown;
    EXPECT_THAT(ending.errors, StartsWith("docuvendctl: ")) << shown;
    EXPECT_EQ(ending.errors.find('\n'), ending.errors.size() - 1) << shown;
  }
}

TEST_F(Commands, AURLAndAPathNameTheSameDocument) {
  EXPECT_EQ(house_.bookmark(QXURL::fileURL(letter_, QXURLKind::file).absoluteString()), house_.bookmark(letter_));
}

TEST_F(Commands, AGrantPrintsWhatOpensTheDocument) {
  const std::string url = QXURL::fileURL(letter_, QXURLKind::file).absoluteString();
  const std::string sibling = QXURL::fileURL(house_.document(".letter.txt"), QXURLKind::file).absoluteString();
  const std::string token = "docuvend-token:[^ \t\n\"]*";
  EXPECT_THAT(house_.confined(kPicker, {"grant", letter_, kCellar, kStranger}).output,
              MatchesRegex("url\t" + url + "\ntoken\t" + token + "\nsiblingURL\t" + sibling + "\nsiblingToken\t" + token + "\n"));
  EXPECT_THAT(house_.confined(kPicker, {"--json", "grant", letter_, kCellar, kStranger}).output,
              MatchesRegex("\\{\"url\":\"" + url + "\",\"token\":\"" + token + "\",\"siblingURL\":\"" + sibling + "\",\"siblingToken\":\"" +
                           token + "\"\\}\n"));
}

TEST_F(Commands, ADocumentIsPrintedAndSavedByteForByte) {
  const std::string string = house_.granted(letter_, kStranger);
  EXPECT_EQ(house_.confined(kStranger, {"cat", string}).output, "Dear all\n");
  const std::string bytes = std::string(200'000, '\0') + "\xff\n\r\x1b[31m";
  const Ending saved = house_.confined(kStranger, {"put", string}, bytes);
  EXPECT_EQ(saved.status, 0) << saved.errors;
  EXPECT_EQ(saved.output, "");
  EXPECT_EQ(house_.confined(kStranger, {"cat", string}).output, bytes);
  eventually("the cloud has it", [this, &bytes] { return contentsOf(house_.cloudFile("letter.txt")) == bytes; });
}

TEST_F(Commands, AFailureInJSONNamesDomainAndCode) {
  const Ending refused = house_.ctl({"--json", "providers"});
  EXPECT_EQ(refused.status, 3);
  EXPECT_THAT(refused.errors, StartsWith("{\"error\":{\"domain\":\"DVErrorDomain\",\"code\":1,\"description\":\""));
}

}  // namespace
}  // namespace docuvend::tests
