// Another user who was faster than the daemon: what it has put where the run-time directory and the sockets are to be is not used.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <iterator>

#include "tests/attacks/RuntimeTest.h"
#include "tests/attacks/StrangerTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

class StrangersPlaces : public WithStranger<RuntimeTest> {
 protected:
  void SetUp() override {
    WithStranger::SetUp();
    if (IsSkipped() || HasFatalFailure()) return;
    openToAll(root());
  }

  [[nodiscard]] std::string root() const { return fs::path(house_.home()).parent_path(); }

  // The stranger does these acts while the directories of the user's on the way are open to all.
  void whileOpen(const std::vector<std::string>& words) const {
    std::vector<std::string> opened;
    for (const std::string& path : {house_.runtime(), directory(), directory() + "/public"}) {
      std::error_code notThere;
      if (fs::status(path, notThere).permissions() != fs::perms::owner_all) continue;
      openWide(path);
      opened.push_back(path);
    }
    EXPECT_THAT(stranger(words), ::testing::AllOf(::testing::Not(::testing::IsEmpty()), ::testing::Each("ok")));
    for (const std::string& path : opened) fs::permissions(path, fs::perms::owner_all);
  }
  // Anew, whatever a daemon left there.
  void makeDirectories() const {
    fs::remove_all(directory());
    for (const std::string& path : {directory(), directory() + "/public"}) {
      fs::create_directory(path);
      fs::permissions(path, fs::perms::owner_all);
    }
  }
};

TEST_F(StrangersPlaces, ADirectoryOfAnotherUsersInPlaceOfTheDaemonsIsNotUsed) {
  whileOpen({"make", directory() + "/public/bait", "open-to-all", directory(), "open-to-all", directory() + "/public"});
  expectRefused(directory() + " belongs to another user");
  EXPECT_THAT(stranger({"reach", socket()}), ElementsAre("EACCES"));
  whileOpen({"remove", directory()});

  fs::create_directory(directory());
  fs::permissions(directory(), fs::perms::owner_all);
  whileOpen({"make", directory() + "/public/bait", "open-to-all", directory() + "/public"});
  expectRefused(directory() + "/public belongs to another user");
  EXPECT_EQ(std::distance(fs::directory_iterator(directory() + "/public"), fs::directory_iterator()), 1) << "nothing was made there";
  whileOpen({"remove", directory() + "/public"});
  expectStarts();
}

TEST_F(StrangersPlaces, ARuntimeDirectoryOfAnotherUsersIsNotUsed) {
  const std::string theirs = root() + "/theirs";
  openWide(root());
  EXPECT_THAT(stranger({"make", theirs + "/bait", "open-to-all", theirs}), ElementsAre("ok", "ok"));
  auto environment = house_.environment();
  for (std::string& entry : environment) {
    if (entry.starts_with("XDG_RUNTIME_DIR=")) entry = "XDG_RUNTIME_DIR=" + theirs;
  }
  const Ending ending = house_.runDaemon(environment);
  EXPECT_EQ(ending.status, 1);
  EXPECT_THAT(ending.errors, HasSubstr(theirs + " belongs to another user"));
  EXPECT_THAT(stranger({"remove", theirs}), ElementsAre("ok"));
  expectStarts();
}

TEST_F(StrangersPlaces, ASocketOfAnotherUsersIsNeitherUsedNorRemoved) {
  for (const std::string& path : {socket(), directory() + "/public/." + kDVServiceName + ".new", house_.administrationSocket()}) {
    makeDirectories();
    whileOpen({"listen", path});
    expectRefused(path + " belongs to another user");
    EXPECT_TRUE(fs::is_socket(path)) << "whoever put it there finds it there";
    whileOpen({"remove", path});
  }
  expectStarts();
}

TEST_F(StrangersPlaces, AKeyOfAnotherUsersIsNotBelievedNorALockOfAnotherUsersTaken) {
  for (const std::string& path : {directory() + "/token-key", directory() + "/lock"}) {
    makeDirectories();
    whileOpen({"put", path, std::string(32, 'k')});
    expectRefused(path);
    whileOpen({"remove", path});
  }
  // One that can be read is not believed either.
  makeDirectories();
  whileOpen({"put", directory() + "/token-key", std::string(32, 'k'), "open-to-all", directory() + "/token-key"});
  expectRefused(directory() + "/token-key belongs to another user");
  whileOpen({"remove", directory() + "/token-key"});
  expectStarts();
}

}  // namespace
}  // namespace docuvend::tests
