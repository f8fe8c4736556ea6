// What is on disk when an answer arrives, and what a restart finds there.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <filesystem>
#include <future>
#include <memory>

#include "common/DVErrors.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using ::testing::HasSubstr;

const ProviderID kCellarID{kCellar};
const ConsumerID kEditorID{kEditor};

class Durability : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
  }
};

// The daemon is killed inside the handler of its answer: what it has not written by then it never writes.
TEST_F(Durability, AGrantIsInTheFileBeforeItsAnswerIsSent) {
  constexpr int kRounds = 5;
  std::vector<QXURL> letters;
  for (int i = 0; i < kRounds; ++i) {
    letters.push_back(QXURL::fileURL(house_.putInCloud("letter" + std::to_string(i), "text"), QXURLKind::file));
  }
  std::vector<std::string> items;
  for (const QXURL& letter : letters) {
    house_.startDaemon();
    const auto caller = house_.client(kPicker);
    const auto named = caller->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(letter);
    ASSERT_EQ(named.index(), 0U);
    const std::string string = std::get<0>(std::get<0>(named)).value_or("");
    items.push_back(string.substr(string.find('/') + 1));

    const auto answered = std::make_shared<std::promise<std::optional<QXError>>>();
    const QXRemote<DVDaemon> remote(caller->endpoint().remoteObjectProxy([answered](const QXError& error) { answered->set_value(error); }));
    remote.call<&DVDaemon::extendSandboxForFileURL>(
        letter, kCellarID, kEditorID,
        [answered, &daemon = house_.daemon()](std::optional<QXError> error, const std::optional<QXData>&, const std::optional<QXURL>&,
                                              const std::optional<QXData>&) {
          daemon.signal(SIGKILL);
          answered->set_value(std::move(error));
        });
    auto answer = answered->get_future();
    ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
    ASSERT_EQ(answer.get(), std::nullopt);
    house_.killDaemon();
    for (const std::string& item : items) EXPECT_THAT(house_.accessControl(), HasSubstr("<string>" + item + "</string>"));
  }
}

TEST_F(Durability, GrantsHoldInADaemonThatIsStartedAfterAKill) {
  const std::string letter = house_.putInCloud("letter.txt", "Dear all\n");
  house_.startDaemon();
  const std::string string = house_.granted(letter, kEditor);
  house_.killDaemon();
  house_.startDaemon();
  const Ending shown = house_.confined(kEditor, {"show", string});
  EXPECT_EQ(shown.output, "Dear all\n") << shown.errors;
  EXPECT_EQ(house_.logged("[INFO] Successfully read access control from disk."), 1);
}

TEST_F(Durability, AFirstStartReadsNothingAndMakesTheDirectory) {
  house_.startDaemon();
  EXPECT_EQ(house_.loggedContaining("access control from disk"), 0);
  EXPECT_TRUE(std::filesystem::is_directory(house_.home() + "/Library/Docuvend"));
  EXPECT_TRUE(std::filesystem::is_empty(house_.home() + "/Library/Docuvend"));
}

TEST_F(Durability, ACorruptFileIsToldAndKeptBesideTheFirstGrant) {
  const std::string letter = house_.putInCloud("letter.txt", "Dear all\n");
  const std::string corrupt = propertyList("<key>half");
  std::filesystem::create_directories(house_.home() + "/Library/Docuvend");
  writeFile(house_.accessControlFile(), corrupt);
  house_.startDaemon();
  EXPECT_EQ(house_.loggedBeginning("[ERROR] Cannot read access control from disk. Error: "), 1);
  EXPECT_EQ(house_.loggedContaining("Successfully read access control"), 0);
  EXPECT_EQ(house_.accessControl(), corrupt);

  const std::string string = house_.granted(letter, kEditor);
  EXPECT_THAT(house_.accessControl(), HasSubstr("<string>" + string.substr(string.find('/') + 1) + "</string>"));
  EXPECT_EQ(contentsOf(house_.accessControlFile() + ".unreadable-1"), corrupt);
  EXPECT_EQ(house_.confined(kEditor, {"show", string}).output, "Dear all\n");
}

TEST_F(Durability, AGrantThatCannotBeWrittenIsToldAndHoldsInMemory) {
  const std::string letter = house_.putInCloud("letter.txt", "Dear all\n");
  house_.startDaemon();
  namespace fs = std::filesystem;
  fs::permissions(house_.home() + "/Library/Docuvend", fs::perms::owner_read | fs::perms::owner_exec);
  const std::string string = house_.granted(letter, kEditor);
  fs::permissions(house_.home() + "/Library/Docuvend", fs::perms::owner_all);
  EXPECT_EQ(house_.logged("[ERROR] Could not write to " + house_.accessControlFile()), 1);
  EXPECT_EQ(house_.accessControl(), "");
  EXPECT_EQ(house_.confined(kEditor, {"show", string}).output, "Dear all\n");

  (void)house_.granted(house_.putInCloud("other.txt", ""), kEditor);
  EXPECT_THAT(house_.accessControl(), HasSubstr("<string>" + string.substr(string.find('/') + 1) + "</string>"));
}

TEST_F(Durability, TokensOutliveTheDaemonThatIssuedThem) {
  const std::string letter = house_.putInCloud("letter.txt", "Dear all\n");
  house_.startDaemon();
  const auto granted =
      house_.client(kPicker)->ask<&DVDaemon::extendSandboxForFileURL>(QXURL::fileURL(letter, QXURLKind::file), kCellarID, kEditorID);
  ASSERT_EQ(granted.index(), 0U);
  const auto token = std::get<1>(std::get<0>(granted));
  ASSERT_TRUE(token);
  house_.killDaemon();
  house_.startDaemon();
  using linux_platform::QXSandboxRedemption;
  const auto redeemed =
      house_.client(std::nullopt, linux_platform::kSandboxServiceName)->ask<&QXSandboxRedemption::redeemToken>(*token, false);
  EXPECT_EQ(errorOf(redeemed), std::nullopt);
}

}  // namespace
}  // namespace docuvend::tests
