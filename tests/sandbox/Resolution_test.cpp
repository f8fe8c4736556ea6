#include "platform/linux/sandbox/Resolution.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <string>

#include "tests/sandbox/SandboxHouse.h"

namespace docuvend::linux_platform {
namespace {

// 0, or the errno value.
int problemOf(const OpenedPath& opened) {
  const auto* failure = std::get_if<SystemFailure>(&opened);
  return failure == nullptr ? 0 : failure->code;
}

class Resolution : public ::testing::Test {
 protected:
  void SetUp() override {
    std::filesystem::create_directories(place_ + "/container/inner");
    std::ofstream(place_ + "/outside") << "outside\n";
    std::ofstream(place_ + "/container/inner/document") << "document\n";
    std::filesystem::create_symlink("inner", place_ + "/container/link");
    std::filesystem::create_symlink("/outside", place_ + "/container/absolute");
    container_ = UniqueDescriptor(::open((place_ + "/container").c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    whole_ = UniqueDescriptor(::open("/", O_PATH | O_DIRECTORY | O_CLOEXEC));
    ASSERT_TRUE(container_ && whole_);
  }

  [[nodiscard]] int beneath(const std::string& path) const { return problemOf(openBeneath(container_.get(), path, Expecting::anything)); }

  const testing::TemporaryDirectory directory_;
  const std::string place_ = directory_.path();
  UniqueDescriptor container_;
  UniqueDescriptor whole_;
};

TEST_F(Resolution, BeneathADirectoryIsWhatItHoldsAndNothingAboveIt) {
  EXPECT_EQ(beneath("inner/document"), 0);
  EXPECT_EQ(beneath("inner/../inner/document"), 0);
  for (const char* path : {"..", "../outside", "inner/../../outside", "../container/inner/document", "/", "/etc"}) {
    EXPECT_EQ(beneath(path), EXDEV) << path;
  }
}

TEST_F(Resolution, BeneathADirectoryNoLinkIsFollowed) {
  for (const char* path : {"link", "link/document", "absolute"}) EXPECT_EQ(beneath(path), ELOOP) << path;
}

TEST_F(Resolution, BeneathADirectoryNothingThatIsMountedThereIsEntered) {
  EXPECT_EQ(problemOf(openBeneath(whole_.get(), "proc/version", Expecting::anything)), EXDEV);
  const UniqueDescriptor proc(::open("/proc", O_PATH | O_DIRECTORY | O_CLOEXEC));
  EXPECT_EQ(problemOf(openBeneath(proc.get(), "version", Expecting::anything)), 0);
}

TEST_F(Resolution, BeneathADirectoryADirectoryIsAskedFor) {
  EXPECT_EQ(problemOf(openBeneath(container_.get(), "inner", Expecting::directory)), 0);
  EXPECT_EQ(problemOf(openBeneath(container_.get(), "inner/document", Expecting::directory)), ENOTDIR);
}

// A name that is missing is never looked for at once: that nothing has it is known for certain in its directory alone.
TEST_F(Resolution, BeneathADirectoryTheCacheAloneIsAskedWhenADirectoryMayBeLocked) {
  const auto cached = [this](const std::string& path) {
    return problemOf(openBeneath(container_.get(), path, Expecting::anything, Lookup::inCacheAlone));
  };
  ASSERT_EQ(beneath("inner/document"), 0);
  EXPECT_EQ(cached("inner/document"), 0);
  EXPECT_EQ(cached("inner/missing"), EAGAIN);
  EXPECT_EQ(beneath("inner/missing"), ENOENT);
  EXPECT_EQ(cached("link"), ELOOP);
}

TEST_F(Resolution, InARootLinksLeadNoFurtherThanIt) {
  EXPECT_EQ(problemOf(openInRoot(container_.get(), "/link/document", FinalLink::followed)), 0);
  EXPECT_EQ(problemOf(openInRoot(container_.get(), "/../../inner/document", FinalLink::followed)), 0) << "above a root is the root";
  EXPECT_EQ(problemOf(openInRoot(container_.get(), "/absolute", FinalLink::followed)), ENOENT);
  EXPECT_EQ(problemOf(openInRoot(container_.get(), "/absolute", FinalLink::itself)), 0);
}

// Such a link names what a process has open, wherever that lies.
TEST_F(Resolution, InARootNoLinkOfTheKernelsOwnIsFollowed) {
  EXPECT_EQ(problemOf(openInRoot(whole_.get(), "/proc/self/cwd", FinalLink::followed)), ELOOP);
  EXPECT_EQ(problemOf(openInRoot(whole_.get(), "/proc/self/status", FinalLink::followed)), 0);
}

}  // namespace
}  // namespace docuvend::linux_platform
