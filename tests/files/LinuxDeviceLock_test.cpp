#include "platform/linux/files/LinuxDeviceLock.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/FakeDeviceLock.h"
#include "tests/files/TemporaryDirectory.h"
#include "tests/files/system_calls.h"

namespace docuvend::linux_platform {
namespace {

using test::readText;
using test::TemporaryDirectory;
using test::writeText;

class LinuxDeviceLockTest : public ::testing::Test {
 protected:
  [[nodiscard]] Paths paths() const {
    Paths paths;
    paths.lockState = path_;
    return paths;
  }

  TemporaryDirectory directory_;
  const std::string path_ = directory_.path("lock-state");
  LinuxDeviceLock lock_{paths()};
};

TEST_F(LinuxDeviceLockTest, AMachineWithoutTheFileHasNoLockProtection) {
  EXPECT_EQ(readLockState(path_), std::nullopt);
  EXPECT_EQ(lock_.lockState(), kQXLockStateUnprotected);
  EXPECT_TRUE(lock_.unlockedSinceBoot());
}

TEST_F(LinuxDeviceLockTest, WhatIsWrittenReadsBack) {
  for (const LockState& state : std::vector<LockState>{{0, false}, {1, true}, {3, false}, {999, true}}) {
    ASSERT_FALSE(writeLockState(path_, state));
    EXPECT_EQ(readLockState(path_), state) << readText(path_);
  }
}

TEST_F(LinuxDeviceLockTest, AStateOutOfRangeIsNotWritten) {
  EXPECT_TRUE(writeLockState(path_, {-1, true}));
  EXPECT_TRUE(writeLockState(path_, {1000, true}));
  EXPECT_FALSE(std::filesystem::exists(path_));
}

TEST_F(LinuxDeviceLockTest, TheFileIsAsItIsDocumented) {
  ASSERT_FALSE(writeLockState(path_, {1, false}));
  EXPECT_EQ(readText(path_), "1\n0\n");
  struct stat status {};
  ASSERT_EQ(::stat(path_.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0600U);
}

TEST_F(LinuxDeviceLockTest, AnythingElseInTheFileDoesNotCount) {
  for (const std::string& text : {std::string(),
                                  std::string("1"),
                                  std::string("1\n"),
                                  std::string("1\n1"),
                                  std::string("1\n2\n"),
                                  std::string("1\n1\n\n"),
                                  std::string("1\n1\nx"),
                                  std::string(" 1\n1\n"),
                                  std::string("-1\n1\n"),
                                  std::string("+1\n1\n"),
                                  std::string("x\n1\n"),
                                  std::string("1 \n1\n"),
                                  std::string("1\r\n1\r\n"),
                                  std::string("1000\n1\n"),
                                  std::string("\n1\n"),
                                  std::string("1\n\n1\n"),
                                  std::string("0000001\n1\n"),
                                  std::string("99999999999999999999\n1\n"),
                                  std::string("1\n1\n\0", 5),
                                  std::string(1000000, '1')}) {
    writeText(path_, text);
    EXPECT_EQ(readLockState(path_), std::nullopt) << text.substr(0, 40);
    EXPECT_EQ(lock_.lockState(), kQXLockStateUnprotected) << text.substr(0, 40);
  }
}

TEST_F(LinuxDeviceLockTest, OnlyARegularFileCounts) {
  writeText(directory_.path("target"), "1\n0\n");
  std::filesystem::create_symlink("target", path_);
  EXPECT_EQ(lock_.lockState(), kQXLockStateUnprotected);
  std::filesystem::remove(path_);
  std::filesystem::create_directory(path_);
  EXPECT_EQ(lock_.lockState(), kQXLockStateUnprotected);
  std::filesystem::remove(path_);
  ASSERT_EQ(::mkfifo(path_.c_str(), 0600), 0);
  EXPECT_EQ(lock_.lockState(), kQXLockStateUnprotected);
}

TEST_F(LinuxDeviceLockTest, AnotherUsersFileDoesNotCount) {
  writeText(path_, "1\n0\n");
  test::SystemCalls calls;
  EXPECT_EQ(lock_.lockState(), 1);
  calls.setEffectiveUser(::geteuid() + 1);
  EXPECT_EQ(lock_.lockState(), kQXLockStateUnprotected);
}

TEST_F(LinuxDeviceLockTest, AReadThatFailsDoesNotCount) {
  writeText(path_, "1\n0\n");
  for (std::size_t number = 1;; ++number) {
    test::SystemCalls calls({number, test::FailureSpan::once, EIO});
    const int state = lock_.lockState();
    if (!calls.hasFailed()) {
      EXPECT_EQ(number, 4U);
      break;
    }
    EXPECT_EQ(state, kQXLockStateUnprotected) << number;
  }
}

// What every adapter of the device lock does, the fake included.
class FakeLock {
 public:
  QXDeviceLock& lock() { return lock_; }
  void set(int state, bool unlockedSinceBoot) {
    lock_.state = state;
    lock_.unlocked = unlockedSinceBoot;
  }

 private:
  fake_platform::FakeDeviceLock lock_;
};

class LinuxLock {
 public:
  QXDeviceLock& lock() { return lock_; }
  void set(int state, bool unlockedSinceBoot) const { EXPECT_FALSE(writeLockState(paths().lockState, {state, unlockedSinceBoot})); }

 private:
  [[nodiscard]] Paths paths() const {
    Paths paths;
    paths.lockState = directory_.path("lock-state");
    return paths;
  }

  TemporaryDirectory directory_;
  LinuxDeviceLock lock_{paths()};
};

template <class Adapter>
class DeviceLockBehavior : public ::testing::Test {
 protected:
  Adapter adapter_;
};

using Adapters = ::testing::Types<FakeLock, LinuxLock>;
TYPED_TEST_SUITE(DeviceLockBehavior, Adapters);

TYPED_TEST(DeviceLockBehavior, StartsWithoutLockProtection) { EXPECT_EQ(this->adapter_.lock().lockState(), kQXLockStateUnprotected); }

TYPED_TEST(DeviceLockBehavior, EveryQuestionSeesThePresentState) {
  this->adapter_.set(1, false);
  EXPECT_EQ(this->adapter_.lock().lockState(), 1);
  EXPECT_FALSE(this->adapter_.lock().unlockedSinceBoot());
  this->adapter_.set(0, true);
  EXPECT_EQ(this->adapter_.lock().lockState(), 0);
  EXPECT_TRUE(this->adapter_.lock().unlockedSinceBoot());
}

}  // namespace
}  // namespace docuvend::linux_platform
