// How the daemon starts, and when it refuses to.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <fstream>

#include "platform/linux/launch/LaunchArguments.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

class Start : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    house_.install(kCellar);
    house_.install(kPicker);
  }

  static std::vector<std::string> without(std::vector<std::string> environment, const std::string& name) {
    std::erase_if(environment, [&name](const std::string& entry) { return entry.starts_with(name + "="); });
    return environment;
  }
};

TEST_F(Start, SaysSoWithItsProgramsPath) {
  house_.startDaemon();
  EXPECT_EQ(house_.logged("[NOTICE] " + std::string(DOCUVEND_BIN) + "/docuvendd starting."), 1);
  EXPECT_EQ(house_.logged("[DEBUG] Debug logging enabled."), 1);
  EXPECT_EQ(house_.logged("[INFO] Server starting."), 1);
}

TEST_F(Start, EveryArgumentIsIgnoredAndItsPathIsTheOneThatItWasStartedBy) {
  const std::string path = std::string(DOCUVEND_BIN) + "/./docuvendd";
  house_.setDaemonWords({path, "--help", "foo"});
  house_.startDaemon();
  EXPECT_EQ(house_.log().at(0), "[NOTICE] " + path + " starting.");
  EXPECT_TRUE(house_.answers());
}

TEST_F(Start, ItsFirstLinesAreTheStartThenTheListThenTheServer) {
  const std::string directory = house_.home() + "/Library/Docuvend";
  std::filesystem::create_directories(directory);
  std::ofstream(directory + "/AccessControl.plist")
      << "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\"><dict/></plist>\n";
  house_.startDaemon();
  const std::string accepted = "[INFO] New connection accepted.";
  ASSERT_TRUE(house_.awaitLog(accepted, 1));
  const auto log = house_.log();
  const auto line = [&log](const std::string& start) {
    const auto found = std::find_if(log.begin(), log.end(), [&start](const std::string& entry) { return entry.starts_with(start); });
    return found - log.begin();
  };
  EXPECT_EQ(line("[NOTICE] " + std::string(DOCUVEND_BIN) + "/docuvendd starting."), 0);
  EXPECT_EQ(line("[DEBUG] Debug logging enabled."), 1);
  EXPECT_LT(line("[DEBUG] Debug logging enabled."), line("[INFO] Successfully read access control from disk."));
  EXPECT_LT(line("[INFO] Successfully read access control from disk."), line("[INFO] Server starting."));
  EXPECT_LT(line("[INFO] Server starting."), line("[INFO] Updating provider list."));
  EXPECT_LT(line("[INFO] Updating provider list."), line(accepted));
}

TEST_F(Start, EveryConnectionIsAcceptedAndLoggedOnce) {
  house_.startDaemon();
  const auto one = house_.client();
  const auto two = house_.client(kPicker);
  for (int i = 0; i < 3; ++i) {
    ASSERT_EQ(one->ask<&DVDaemon::wakeUpCompletion>().index(), 0U);
    ASSERT_EQ(two->ask<&DVDaemon::wakeUpCompletion>().index(), 0U);
  }
  // The line follows the acceptance, so an answer may be faster.
  const std::string accepted = "[INFO] New connection accepted.";
  ASSERT_TRUE(house_.awaitLog(accepted, 3));
  EXPECT_EQ(house_.logged(accepted), 3);
  EXPECT_EQ(house_.logged("[DEBUG] Serving: wakeUpCompletion:"), 7);
}

TEST_F(Start, TakesAllTheDescriptorsThatItMayHaveAndLeavesAnExtensionItsOwnNumber) {
  rlimit usual{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &usual), 0);
  ASSERT_GT(usual.rlim_max, linux_platform::kExtensionOpenFiles);
  rlimit low = usual;
  low.rlim_cur = linux_platform::kExtensionOpenFiles / 2;
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &low), 0);
  house_.startDaemon();
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &usual), 0);
  const auto descriptorsOf = [](pid_t process) {
    rlimit limit{};
    EXPECT_EQ(::prlimit(process, RLIMIT_NOFILE, /*new_limit=*/nullptr, &limit), 0);
    return std::pair(limit.rlim_cur, limit.rlim_max);
  };
  EXPECT_EQ(descriptorsOf(house_.daemon().pid()), std::pair(usual.rlim_max, usual.rlim_max));
  const auto extensions = house_.processesOf("cellar");
  ASSERT_EQ(extensions.size(), 1U);
  const rlim_t own = linux_platform::kExtensionOpenFiles;
  EXPECT_EQ(descriptorsOf(extensions[0]), std::pair(own, own));
}

TEST_F(Start, WithoutASettingOnlyNoticesAndErrorsAreLogged) {
  house_.startDaemon("");
  ASSERT_NE(house_.ctl({"grant", "/x", kCellar, kPicker}).status, 0);
  const auto log = house_.log();
  EXPECT_GE(house_.loggedBeginning("[NOTICE] "), 1);
  EXPECT_EQ(house_.loggedBeginning("[ERROR] Rejecting request from PID "), 1);
  EXPECT_THAT(log, Not(::testing::Contains(StartsWith("[INFO]"))));
  EXPECT_THAT(log, Not(::testing::Contains(StartsWith("[DEBUG]"))));
}

TEST_F(Start, WithTheInfoSettingDebugLinesStayAway) {
  house_.startDaemon("info");
  EXPECT_GE(house_.loggedBeginning("[INFO] "), 1);
  EXPECT_EQ(house_.loggedBeginning("[DEBUG] "), 0);
}

TEST_F(Start, ClientsThatComeBeforeTheProvidersAreKnownWaitForThem) {
  house_.startDaemon();
  ASSERT_TRUE(house_.awaitLog("[INFO] New connection accepted."));
  const auto log = house_.log();
  const auto registered = std::find_if(log.begin(), log.end(), [](const std::string& line) {
    return line.starts_with("[INFO] Registered docuvend extension com.orvane.cellar for path ");
  });
  const auto accepted = std::find(log.begin(), log.end(), "[INFO] New connection accepted.");
  ASSERT_NE(registered, log.end());
  ASSERT_NE(accepted, log.end());
  EXPECT_LT(registered, accepted);
}

TEST_F(Start, ALockedDeviceIsServedWithoutProviders) {
  std::filesystem::create_directory(house_.runtime() + "/docuvend");
  std::filesystem::permissions(house_.runtime() + "/docuvend", std::filesystem::perms::owner_all);
  writeFile(house_.runtime() + "/docuvend/lock-state", "1\n0\n");
  const std::string letter = house_.putInCloud("letter.txt", "Dear all\n");
  house_.startDaemon();
  EXPECT_EQ(house_.logged("[INFO] Not instantiating docuvends until first unlock."), 1);
  const auto listed = house_.client(kPicker)->ask<&DVDaemon::providersCompletionHandler>();
  ASSERT_EQ(listed.index(), 0U);
  EXPECT_EQ(std::get<0>(listed), std::make_tuple(std::optional<QXError>(), std::optional(QXDictionary())));
  const auto named = house_.client()->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(QXURL::fileURL(letter, QXURLKind::file));
  ASSERT_EQ(named.index(), 0U);
  EXPECT_EQ(std::get<0>(std::get<0>(named)), std::nullopt);
  EXPECT_FALSE(std::filesystem::exists(letter)) << "the provider was run";
}

TEST_F(Start, ADeviceThatHasBeenUnlockedHasItsProviders) {
  std::filesystem::create_directory(house_.runtime() + "/docuvend");
  std::filesystem::permissions(house_.runtime() + "/docuvend", std::filesystem::perms::owner_all);
  writeFile(house_.runtime() + "/docuvend/lock-state", "1\n1\n");
  house_.startDaemon();
  EXPECT_EQ(house_.loggedContaining("until first unlock"), 0);
  EXPECT_EQ(house_.loggedBeginning("[INFO] Registered docuvend extension com.orvane.cellar for path "), 1);
}

TEST_F(Start, ASecondDaemonOfTheUserIsRefusedAndTheFirstGoesOn) {
  house_.startDaemon();
  const Ending second = house_.runDaemon(house_.environment());
  EXPECT_EQ(second.status, 1);
  EXPECT_THAT(second.errors, HasSubstr("another docuvendd of this user is running"));
  EXPECT_TRUE(house_.answers());
}

TEST_F(Start, WithoutARunTimeDirectoryItSaysSoAndUsesNoOther) {
  const Ending ending = house_.runDaemon(without(house_.environment(), "XDG_RUNTIME_DIR"));
  EXPECT_EQ(ending.status, 1);
  EXPECT_THAT(ending.errors, HasSubstr("XDG_RUNTIME_DIR is not set to an absolute path"));
  EXPECT_FALSE(std::filesystem::exists(house_.home() + "/Library"));
}

TEST_F(Start, WithoutAHomeItSaysSo) {
  const Ending ending = house_.runDaemon(without(house_.environment(), "HOME"));
  EXPECT_EQ(ending.status, 1);
  EXPECT_THAT(ending.errors, HasSubstr("HOME"));
}

TEST_F(Start, ARunTimeDirectoryThatOthersMayEnterIsRefused) {
  std::filesystem::permissions(house_.runtime(), std::filesystem::perms::group_exec, std::filesystem::perm_options::add);
  const Ending ending = house_.runDaemon(house_.environment());
  EXPECT_EQ(ending.status, 1);
  EXPECT_THAT(ending.errors, HasSubstr(house_.runtime()));
}

TEST_F(Start, ASocketThatAKilledDaemonLeftIsReplaced) {
  house_.startDaemon();
  house_.killDaemon();
  ASSERT_TRUE(std::filesystem::exists(house_.publicSocket(kDVServiceName)));
  house_.startDaemon();
  EXPECT_TRUE(house_.answers());
}

TEST_F(Start, TheSocketsAndTheGrantsAreTheUsersAlone) {
  house_.startDaemon();
  (void)house_.granted(house_.putInCloud("letter.txt", ""), kPicker);
  for (const std::string& path : {house_.publicSocket(kDVServiceName), house_.publicSocket("com.orvane.Sandbox"),
                                  house_.publicSocket("com.orvane.FileCoordination"), house_.accessControlFile()}) {
    struct stat status {};
    ASSERT_EQ(::stat(path.c_str(), &status), 0) << path;
    EXPECT_EQ(status.st_mode & 0777U, 0600U) << path;
  }
}

}  // namespace
}  // namespace docuvend::tests
