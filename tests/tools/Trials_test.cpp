// What this machine gives, tried by this process.
#include "tools/docuvendctl/Trials.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/ioctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/launch/policy/Landlock.h"

namespace docuvend::ctl {
namespace {

using ::testing::HasSubstr;
using ::testing::Optional;

TEST(Trials, WhatTheKernelGivesWorks) {
  EXPECT_EQ(tryUserNamespace(), std::nullopt);
  EXPECT_EQ(tryLandlock(linux_platform::landlockLevel()), std::nullopt);
  EXPECT_EQ(trySystemCalls(), std::nullopt);
  EXPECT_EQ(tryWatch(), std::nullopt);
}

TEST(Trials, AKernelThatWatchesNoMoreIsFoundOut) {
  rlimit before{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &before), 0);
  const rlimit none{0, before.rlim_max};
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &none), 0);
  const auto failure = tryWatch();
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &before), 0);
  EXPECT_THAT(failure, Optional(HasSubstr("max_user_watches")));
}

TEST(Trials, ALandlockThatDoesNotRestrictIsFoundOut) { EXPECT_THAT(tryLandlock(0), Optional(HasSubstr("could not be restricted"))); }

TEST(Trials, ALaunchIsThatOfAnOrdinaryUser) {
  if (::geteuid() == 0) {
    EXPECT_THAT(tryLaunch(), Optional(HasSubstr("root cannot be confined")));
  } else {
    EXPECT_EQ(tryLaunch(), std::nullopt);
  }
}

// This process is none the worse for it.
TEST(Trials, RestrictNobodyElse) {
  ASSERT_EQ(tryLandlock(linux_platform::landlockLevel()), std::nullopt);
  ASSERT_EQ(trySystemCalls(), std::nullopt);
  const linux_platform::UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  EXPECT_EQ(::ioctl(socket.get(), TIOCSTI, "x"), -1);
  EXPECT_EQ(errno, ENOTTY) << "the call is made, and the socket is no terminal";
  EXPECT_TRUE(linux_platform::UniqueDescriptor(::open("/", O_RDONLY | O_DIRECTORY | O_CLOEXEC)));
  EXPECT_EQ(tryUserNamespace(), std::nullopt);
}

}  // namespace
}  // namespace docuvend::ctl
