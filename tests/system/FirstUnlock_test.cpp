// A daemon that is started on a locked device, and what its first unlock brings.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdlib.h>

#include <chrono>
#include <filesystem>
#include <memory>

#include "common/DVErrors.h"
#include "sdk/Administrator.h"
#include "tests/system/house/DaemonHouse.h"
#include "tests/system/knock.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;

const ProviderID kCellarID{kCellar};
const ConsumerID kEditorID{kEditor};
const std::string kKnocker = "com.orvane.knocker";

const std::string kWaits = "[INFO] Not instantiating docuvends until first unlock.";
const std::string kRead = "[INFO] Successfully read access control from disk.";
const std::string kUpdating = "[INFO] Updating provider list.";
const std::string kRegistered = "[INFO] Registered docuvend extension com.orvane.cellar for path ";

class FirstUnlock : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
    house_.putInCloud("letter.txt", "Dear all\n");
    ASSERT_EQ(::setenv("XDG_RUNTIME_DIR", house_.runtime().c_str(), /*replace=*/1), 0);
    fs::create_directory(house_.runtime() + "/docuvend");
    fs::permissions(house_.runtime() + "/docuvend", fs::perms::owner_all);
  }

  void setLock(const std::string& state, bool unlockedSinceBoot) const {
    writeFile(house_.runtime() + "/docuvend/lock-state", state + "\n" + (unlockedSinceBoot ? "1" : "0") + "\n");
  }
  void startLocked() {
    setLock("1", /*unlockedSinceBoot=*/false);
    house_.startDaemon();
    ASSERT_EQ(house_.logged(kWaits), 1);
  }
  static Failure announce() {
    auto connected = Administrator::connect({});
    if (auto* error = std::get_if<QXError>(&connected)) return *error;
    return std::get<std::unique_ptr<Administrator>>(connected)->announceFirstUnlock();
  }
  void unlock() {
    setLock("1", /*unlockedSinceBoot=*/true);
    EXPECT_EQ(announce(), std::nullopt);
  }
  void awaitProviders() { ASSERT_TRUE(house_.awaitLog(kRegistered)); }
  [[nodiscard]] QXDictionary providers() const {
    const auto listed = house_.client(kPicker)->ask<&DVDaemon::providersCompletionHandler>();
    if (listed.index() != 0) return {{"undelivered", true}};
    return std::get<1>(std::get<0>(listed)).value_or(QXDictionary{{"failed", true}});
  }
  void writeGrant(const std::string& item) const {
    fs::create_directories(fs::path(house_.accessControlFile()).parent_path());
    writeFile(house_.accessControlFile(), propertyList("<key>com.orvane.cellar</key><dict><key>com.orvane.editor</key><dict>"
                                                       "<key>AllowedItemIDs</key><array><string>" +
                                                       item + "</string></array></dict></dict>"));
  }
  static std::size_t grantCount() {
    auto connected = Administrator::connect({});
    if (connected.index() != 0) return 0;
    const auto listed = std::get<0>(connected)->grants(std::nullopt, std::nullopt);
    return listed.index() == 0 ? std::get<0>(listed).size() : 0;
  }

  const QXURL letter_ = QXURL::fileURL(house_.document("letter.txt"), QXURLKind::file);
};

TEST_F(FirstUnlock, ALockedDaemonAnswersAndKnowsNoProvider) {
  startLocked();
  EXPECT_TRUE(house_.answers());
  EXPECT_EQ(providers(), QXDictionary());
  EXPECT_EQ(errorOf(house_.client(kPicker)->ask<&DVDaemon::startProvidingItemAtURL>(letter_, kCellarID, kEditorID)),
            DVNotFoundError(DVNotFoundError(kCellarID)));
  EXPECT_EQ(errorOf(house_.client(kPicker)->ask<&DVDaemon::extendSandboxForFileURL>(letter_, kCellarID, kEditorID)),
            DVNotFoundError(kCellarID));
  EXPECT_EQ(house_.logged(kUpdating), 0);
  EXPECT_TRUE(house_.processesOf("cellar").empty());
}

TEST_F(FirstUnlock, AStringIsNotResolvedBeforeAndTheCallersDeadlineEndsIt) {
  writeGrant("i");
  startLocked();
  const auto caller = house_.client(kEditor);
  const auto outcome = sdk_detail::callAndWait<&DVDaemon::documentURLFromBookmarkableString>(
      caller->endpoint(), {sdk_detail::after(std::chrono::milliseconds(500))}, std::string("docuvend:com.orvane.cellar/i"));
  EXPECT_TRUE(std::holds_alternative<sdk_detail::NotInTime>(outcome));
  EXPECT_EQ(house_.logged("[DEBUG] Getting URL from bookmarkable string: “docuvend:com.orvane.cellar/i”."), 1);
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::documentURLFromBookmarkableString>("docuvend:com.orvane.cellar/other")), DVNotPermittedError())
      << "what is not granted is refused at once";
}

TEST_F(FirstUnlock, TheUnlockBringsTheProvidersAndTheDocumentsWay) {
  startLocked();
  const auto early = house_.client(kPicker);  // a connection from before
  ASSERT_EQ(early->ask<&DVDaemon::wakeUpCompletion>().index(), 0U);
  unlock();
  awaitProviders();
  EXPECT_EQ(house_.loggedContaining(" announces the first unlock."), 1);
  EXPECT_EQ(house_.logged("[NOTICE] PID " + std::to_string(::getpid()) + " announces the first unlock."), 1);
  EXPECT_TRUE(providers().contains(kCellar));
  ASSERT_EQ(errorOf(early->ask<&DVDaemon::extendSandboxForFileURL>(letter_, kCellarID, kEditorID)), std::nullopt);
  const auto named = early->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(letter_);
  ASSERT_EQ(errorOf(named), std::nullopt);
  const Ending shown = house_.confined(kEditor, {"show", std::get<0>(std::get<0>(named)).value_or("")});
  EXPECT_EQ(shown.output, "Dear all\n") << shown.errors;
}

TEST_F(FirstUnlock, TheListIsReadAgainAndAFileThatAppearedMeanwhileIsSeen) {
  startLocked();
  EXPECT_EQ(house_.logged(kRead), 0) << "there was none";
  writeGrant("i");
  EXPECT_EQ(grantCount(), 0U);
  unlock();
  EXPECT_TRUE(house_.awaitLog(kRead));
  EXPECT_EQ(grantCount(), 1U);
}

TEST_F(FirstUnlock, ASecondUnlockIsHarmless) {
  writeGrant("i");
  startLocked();
  unlock();
  awaitProviders();
  EXPECT_EQ(announce(), std::nullopt);
  ASSERT_TRUE(house_.awaitLog(kRead, 3)) << "at the start and at each unlock";
  EXPECT_TRUE(house_.answers());
  EXPECT_TRUE(providers().contains(kCellar));
  EXPECT_EQ(house_.logged(kUpdating), 1);
  EXPECT_EQ(house_.loggedBeginning(kRegistered), 1);
  EXPECT_EQ(grantCount(), 1U);
}

TEST_F(FirstUnlock, ADaemonThatIsUnlockedTakesAnAnnouncementWithoutRegisteringAgain) {
  writeGrant("i");
  setLock("1", /*unlockedSinceBoot=*/true);
  house_.startDaemon();
  ASSERT_EQ(house_.loggedBeginning(kRegistered), 1);
  EXPECT_EQ(announce(), std::nullopt);
  ASSERT_TRUE(house_.awaitLog(kRead, 2));
  EXPECT_TRUE(house_.answers());
  EXPECT_TRUE(providers().contains(kCellar));
  EXPECT_EQ(house_.logged(kUpdating), 1);
  EXPECT_EQ(house_.loggedBeginning(kRegistered), 1);
}

TEST_F(FirstUnlock, AMachineWithoutLockProtectionNeverWaits) {
  setLock("3", /*unlockedSinceBoot=*/false);
  house_.startDaemon();
  EXPECT_EQ(house_.logged(kWaits), 0);
  EXPECT_EQ(house_.loggedBeginning(kRegistered), 1);
}

TEST_F(FirstUnlock, TheStateFileAloneAnnouncesNothing) {
  startLocked();
  setLock("1", /*unlockedSinceBoot=*/true);
  EXPECT_TRUE(house_.answers());
  EXPECT_EQ(providers(), QXDictionary());
  unlock();
  awaitProviders();
}

TEST_F(FirstUnlock, AnAnnouncementFromInsideAConfinementIsImpossible) {
  house_.install(kKnocker, "docuvend-knocker", stringEntry("QXBundleIdentifier", kKnocker), {});
  startLocked();
  const std::string door = house_.publicSocket("door");
  fs::create_hard_link(house_.administrationSocket(), door);
  const Ending unseen = house_.confined(kKnocker, {house_.administrationSocket(), "first-unlock"});
  EXPECT_EQ(unseen.output, "not reached: QXSystemErrorDomain " + std::to_string(ENOENT) + "\n") << unseen.errors;
  const Ending refused = house_.confined(kKnocker, {door, "first-unlock"});
  EXPECT_EQ(refused.output, "QXRpcErrorDomain 9\n") << refused.errors;
  EXPECT_TRUE(house_.answers());
  EXPECT_EQ(providers(), QXDictionary());
  EXPECT_EQ(house_.loggedContaining(" announces the first unlock."), 0);
  EXPECT_EQ(knock(door, {"first-unlock"}), "answered") << "the same from outside";
  awaitProviders();
}

}  // namespace
}  // namespace docuvend::tests
