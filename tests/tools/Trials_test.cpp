// What this machine gives, tried by this process.
#include "tools/docuvendctl/Trials.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/launch/policy/Landlock.h"

namespace docuvend::ctl {
namespace {

using ::testing::HasSubstr;
using ::testing::Optional;

TEST(Trials, WhatTheKernelGivesWorks) {
  EXPECT_EQ(tryUserNamespace(), std::nullopt);
  EXPECT_EQ(tryLandlock(linux_platform::landlockLevel()), std::nullopt);
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
  EXPECT_TRUE(linux_platform::UniqueDescriptor(::open("/", O_RDONLY | O_DIRECTORY | O_CLOEXEC)));
  EXPECT_EQ(tryUserNamespace(), std::nullopt);
}

}  // namespace
}  // namespace docuvend::ctl
