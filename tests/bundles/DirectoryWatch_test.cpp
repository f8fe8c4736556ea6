#include "platform/linux/bundles/DirectoryWatch.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <fstream>

#include "tests/bundles/BundleHouse.h"

namespace docuvend::linux_platform {
namespace {

using ::testing::ElementsAre;

class DirectoryWatchTest : public ::testing::Test {
 protected:
  [[nodiscard]] bool hasChanges() { return !watch_.takeChanges().empty(); }
  // "kind directory name" of each change, every one once, with "/" behind the name of a directory; the place itself is "*".
  [[nodiscard]] std::vector<std::string> changes() {
    std::vector<std::string> result;
    for (const auto& change : watch_.takeChanges()) {
      std::string text = change.kind == DirectoryChange::Kind::written ? "written " : "went ";
      text += change.directory.substr(place_.size()) + "*" + change.name + (change.isOfDirectory ? "/" : "");
      if (std::find(result.begin(), result.end(), text) == result.end()) result.push_back(text);
    }
    return result;
  }

  BundleHouse house_;
  const std::string place_ = house_.root() + "/a/b";
  DirectoryWatch watch_;
};

TEST_F(DirectoryWatchTest, NoticesTheWayAppearingStepByStep) {
  ASSERT_TRUE(watch_.watch({place_}));
  EXPECT_FALSE(hasChanges());
  std::filesystem::create_directory(house_.root() + "/a");
  EXPECT_TRUE(hasChanges());
  ASSERT_TRUE(watch_.watch({place_}));
  std::filesystem::create_directory(place_);
  EXPECT_TRUE(hasChanges());
  ASSERT_TRUE(watch_.watch({place_}));
  BundleHouse::write(place_ + "/file", "x");
  EXPECT_TRUE(hasChanges());
  EXPECT_FALSE(hasChanges());
}

TEST_F(DirectoryWatchTest, NoticesThatADirectoryOnTheWayIsReplaced) {
  std::filesystem::create_directories(place_);
  ASSERT_TRUE(watch_.watch({place_}));
  std::filesystem::rename(house_.root() + "/a", house_.root() + "/old");
  EXPECT_TRUE(hasChanges());
  ASSERT_TRUE(watch_.watch({place_}));
  std::filesystem::create_directories(place_);
  EXPECT_TRUE(hasChanges());
  ASSERT_TRUE(watch_.watch({place_}));
  BundleHouse::write(place_ + "/file", "x");
  EXPECT_TRUE(hasChanges());
}

TEST_F(DirectoryWatchTest, DoesNotMindWhatHappensBesideTheWay) {
  std::filesystem::create_directories(place_);
  ASSERT_TRUE(watch_.watch({place_}));
  BundleHouse::write(house_.root() + "/other", "x");
  BundleHouse::write(house_.root() + "/a/other", "x");
  EXPECT_FALSE(hasChanges());
}

TEST_F(DirectoryWatchTest, TakesLostEventsForAChange) {
  std::filesystem::create_directories(place_);
  ASSERT_TRUE(watch_.watch({place_}));
  std::size_t most = 0;
  std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> most;
  ASSERT_GT(most, 0U);
  const std::string beside = house_.root() + "/a/other";
  for (std::size_t i = 0; i <= most / 2; ++i) {
    BundleHouse::write(beside, "");
    ::unlink(beside.c_str());
  }
  const auto changes = watch_.takeChanges();
  ASSERT_FALSE(changes.empty());
  EXPECT_EQ(changes.back().kind, DirectoryChange::Kind::lost);
  EXPECT_TRUE(changes.back().isOfDirectory) << "there may be others to watch now";
}

TEST_F(DirectoryWatchTest, TellsWhatIsWrittenFromWhatComesAndGoes) {
  std::filesystem::create_directories(place_);
  ASSERT_TRUE(watch_.watch({place_}));
  BundleHouse::write(place_ + "/file", "x");
  EXPECT_THAT(changes(), ElementsAre("written *file"));
  std::filesystem::rename(place_ + "/file", place_ + "/other");
  EXPECT_THAT(changes(), ElementsAre("went *file", "went *other"));
  std::filesystem::remove(place_ + "/other");
  EXPECT_THAT(changes(), ElementsAre("went *other"));
  std::filesystem::create_directory(place_ + "/directory");
  EXPECT_THAT(changes(), ElementsAre("written *directory/"));
  std::filesystem::remove(place_ + "/directory");
  EXPECT_THAT(changes(), ElementsAre("went *directory/"));
}

TEST_F(DirectoryWatchTest, NoticesEveryWriteIntoAFileThatStaysOpen) {
  std::filesystem::create_directories(place_);
  std::ofstream file(place_ + "/file");
  ASSERT_TRUE(watch_.watch({place_}));
  for (int i = 0; i < 2; ++i) {
    file << "x" << std::flush;
    EXPECT_THAT(changes(), ElementsAre("written *file"));
  }
}

TEST_F(DirectoryWatchTest, HearsNothingMoreFromADirectoryThatChangedPlacesUntilItIsWatchedAgain) {
  const std::string old = place_ + "/a";
  const std::string fresh = house_.root() + "/fresh";
  std::filesystem::create_directories(old + "/sub");
  std::filesystem::create_directories(place_ + "/ab");
  std::filesystem::create_directories(fresh);
  ASSERT_TRUE(watch_.watch({place_, old, old + "/sub", place_ + "/ab"}));
  ASSERT_EQ(::renameat2(AT_FDCWD, old.c_str(), AT_FDCWD, fresh.c_str(), RENAME_EXCHANGE), 0);
  BundleHouse::write(fresh + "/sub/file", "x");
  BundleHouse::write(fresh + "/file", "x");
  BundleHouse::write(place_ + "/ab/file", "x");
  EXPECT_THAT(changes(), ElementsAre("went *a/", "written /ab*file"));
  ASSERT_TRUE(watch_.watch({place_, old}));
  BundleHouse::write(fresh + "/other", "x");
  EXPECT_FALSE(hasChanges());
  BundleHouse::write(old + "/file", "x");
  EXPECT_THAT(changes(), ElementsAre("written /a*file"));
}

}  // namespace
}  // namespace docuvend::linux_platform
