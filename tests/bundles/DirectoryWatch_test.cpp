#include "platform/linux/bundles/DirectoryWatch.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <fstream>

#include "tests/bundles/BundleHouse.h"

namespace docuvend::linux_platform {
namespace {

class DirectoryWatchTest : public ::testing::Test {
 protected:
  BundleHouse house_;
  const std::string place_ = house_.root() + "/a/b";
  DirectoryWatch watch_;
};

TEST_F(DirectoryWatchTest, NoticesTheWayAppearingStepByStep) {
  ASSERT_TRUE(watch_.watch({place_}));
  EXPECT_FALSE(watch_.takeEvents());
  std::filesystem::create_directory(house_.root() + "/a");
  EXPECT_TRUE(watch_.takeEvents());
  ASSERT_TRUE(watch_.watch({place_}));
  std::filesystem::create_directory(place_);
  EXPECT_TRUE(watch_.takeEvents());
  ASSERT_TRUE(watch_.watch({place_}));
  BundleHouse::write(place_ + "/file", "x");
  EXPECT_TRUE(watch_.takeEvents());
  EXPECT_FALSE(watch_.takeEvents());
}

TEST_F(DirectoryWatchTest, NoticesThatADirectoryOnTheWayIsReplaced) {
  std::filesystem::create_directories(place_);
  ASSERT_TRUE(watch_.watch({place_}));
  std::filesystem::rename(house_.root() + "/a", house_.root() + "/old");
  EXPECT_TRUE(watch_.takeEvents());
  ASSERT_TRUE(watch_.watch({place_}));
  std::filesystem::create_directories(place_);
  EXPECT_TRUE(watch_.takeEvents());
  ASSERT_TRUE(watch_.watch({place_}));
  BundleHouse::write(place_ + "/file", "x");
  EXPECT_TRUE(watch_.takeEvents());
}

TEST_F(DirectoryWatchTest, DoesNotMindWhatHappensBesideTheWay) {
  std::filesystem::create_directories(place_);
  ASSERT_TRUE(watch_.watch({place_}));
  BundleHouse::write(house_.root() + "/other", "x");
  BundleHouse::write(house_.root() + "/a/other", "x");
  EXPECT_FALSE(watch_.takeEvents());
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
  EXPECT_TRUE(watch_.takeEvents());
}

}  // namespace
}  // namespace docuvend::linux_platform
