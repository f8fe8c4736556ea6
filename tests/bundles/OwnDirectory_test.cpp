#include "platform/linux/bundles/OwnDirectory.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>

#include "tests/bundles/BundleHouse.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;

class OwnDirectoryTest : public ::testing::Test {
 protected:
  static std::string made(const std::string& path) {
    const auto result = makeOwnDirectory(path);
    const auto* error = std::get_if<QXError>(&result);
    return error != nullptr ? "error " + std::to_string(error->code) : std::get<std::string>(result);
  }
  static unsigned modeOf(const std::string& path) {
    struct stat status {};
    EXPECT_EQ(::lstat(path.c_str(), &status), 0) << path;
    return status.st_mode & 07777U;
  }

  BundleHouse house_;
  const std::string place_ = house_.root() + "/place";
};

TEST_F(OwnDirectoryTest, IsMadeWithItsParentsForTheUserAloneWhateverTheMask) {
  for (const mode_t mask : {0000, 0002, 0022}) {
    const mode_t before = ::umask(mask);
    const std::string parent = place_ + std::to_string(mask);
    EXPECT_EQ(made(parent + "/b/c"), parent + "/b/c");
    ::umask(before);
    for (const std::string& directory : {parent, parent + "/b", parent + "/b/c"}) EXPECT_EQ(modeOf(directory), 0700U);
  }
}

TEST_F(OwnDirectoryTest, WhatIsThereIsLeftAsItIs) {
  fs::create_directories(place_ + "/b");
  ::chmod(place_.c_str(), 0750);
  ::chmod((place_ + "/b").c_str(), 0755);
  EXPECT_EQ(made(place_ + "/b"), place_ + "/b");
  EXPECT_EQ(modeOf(place_), 0750U);
  EXPECT_EQ(modeOf(place_ + "/b"), 0755U);
}

TEST_F(OwnDirectoryTest, MayLieBehindALinkAndMustBeNone) {
  fs::create_directory(place_);
  fs::create_directory_symlink(place_, house_.root() + "/link");
  EXPECT_EQ(made(house_.root() + "/link/b"), place_ + "/b");
  EXPECT_EQ(made(house_.root() + "/link"), "error " + std::to_string(ENOTDIR));
  BundleHouse::write(house_.root() + "/file", "");
  EXPECT_EQ(made(house_.root() + "/file"), "error " + std::to_string(ENOTDIR));
  EXPECT_EQ(made(house_.root() + "/file/b"), "error " + std::to_string(ENOTDIR));
}

TEST_F(OwnDirectoryTest, WhatAnotherOwnsOrCanWriteIsDistrusted) {
  ASSERT_NE(::geteuid(), 0U) << "run this as a user: root is two of the users that are told apart here";
  const uid_t another = ::geteuid() + 1;
  struct Case {
    uid_t user;
    mode_t mode;
    TrustedOwner owner;
    std::string expected;
  };
  for (const auto& [user, mode, owner, expected] :
       std::vector<Case>{{::geteuid(), S_IFDIR | 0755, TrustedOwner::thisUser, ""},
                         {::geteuid(), S_IFREG | 0600, TrustedOwner::thisUserOrRoot, ""},
                         {::geteuid(), S_IFDIR | 0775, TrustedOwner::thisUser, "can be written by others"},
                         {::geteuid(), S_IFREG | 0646, TrustedOwner::thisUserOrRoot, "can be written by others"},
                         {::geteuid(), S_IFLNK | 0777, TrustedOwner::thisUser, ""},
                         {0, S_IFDIR | 0755, TrustedOwner::thisUserOrRoot, ""},
                         {0, S_IFDIR | 01777, TrustedOwner::thisUserOrRoot, "can be written by others"},
                         {0, S_IFDIR | 0755, TrustedOwner::thisUser, "belongs to another user"},
                         {another, S_IFDIR | 0755, TrustedOwner::thisUser, "belongs to another user"},
                         {another, S_IFDIR | 0755, TrustedOwner::thisUserOrRoot, "belongs to another user"}}) {
    struct stat status {};
    status.st_uid = user;
    status.st_mode = mode;
    EXPECT_EQ(distrust(status, owner).value_or(""), expected) << user << " " << std::oct << mode;
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
