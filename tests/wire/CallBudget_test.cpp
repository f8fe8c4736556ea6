#include "platform/linux/wire/CallBudget.h"

#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

constexpr std::size_t kPlenty = 1000;

TEST(CallBudget, GivesNoMoreThanItsLimitUntilAShareComesBack) {
  const auto budget = std::make_shared<CallBudget>(CallLimits{2, kPlenty});
  auto one = budget->take(1);
  const auto two = budget->take(1);
  ASSERT_TRUE(one && two);
  EXPECT_FALSE(budget->take(1));
  EXPECT_FALSE(budget->take(1));
  one.reset();
  one = budget->take(1);
  EXPECT_TRUE(one);
  EXPECT_FALSE(budget->take(1));
}

TEST(CallBudget, WhatOneTakesIsMissingInAnotherThatLiesWithinTheSame) {
  const auto shared = std::make_shared<CallBudget>(CallLimits{2, kPlenty});
  const auto first = std::make_shared<CallBudget>(CallLimits{2, kPlenty}, shared);
  const auto second = std::make_shared<CallBudget>(CallLimits{2, kPlenty}, shared);
  auto one = first->take(1);
  const auto two = second->take(1);
  ASSERT_TRUE(one && two);
  EXPECT_FALSE(first->take(1));
  EXPECT_FALSE(second->take(1));
  one.reset();
  EXPECT_TRUE(second->take(1));
}

TEST(CallBudget, ARefusalTakesNothing) {
  const auto shared = std::make_shared<CallBudget>(CallLimits{2, kPlenty});
  const auto full = std::make_shared<CallBudget>(CallLimits{1, kPlenty}, shared);
  auto one = full->take(1);
  ASSERT_TRUE(one);
  EXPECT_FALSE(full->take(1));
  const auto two = shared->take(1);
  EXPECT_TRUE(two) << "refused by itself, it had asked nothing of what is around it";
  one.reset();
  auto three = shared->take(1);
  ASSERT_TRUE(three);
  EXPECT_FALSE(full->take(1));
  three.reset();
  EXPECT_TRUE(full->take(1)) << "refused by what is around it, it kept nothing of its own";
}

TEST(CallBudget, AShareOutlivesWhoeverGaveIt) {
  const auto shared = std::make_shared<CallBudget>(CallLimits{1, kPlenty});
  auto share = std::make_shared<CallBudget>(CallLimits{1, kPlenty}, shared)->take(1);
  EXPECT_FALSE(shared->take(1));
  share.reset();
  EXPECT_TRUE(shared->take(1));
}

TEST(CallBudget, RequestsHaveTogetherNoMoreBytesThanItsLimit) {
  const auto budget = std::make_shared<CallBudget>(CallLimits{10, 100});
  const auto one = budget->take(60);
  ASSERT_TRUE(one);
  EXPECT_FALSE(budget->take(41));
  auto two = budget->take(40);
  EXPECT_TRUE(two);
  EXPECT_FALSE(budget->take(1));
  two.reset();
  EXPECT_TRUE(budget->take(40));
}

TEST(CallBudget, ARequestThatFindsNoOtherMayBeLongerThanTheLimit) {
  const auto shared = std::make_shared<CallBudget>(CallLimits{10, 100});
  const auto first = std::make_shared<CallBudget>(CallLimits{10, 100}, shared);
  const auto second = std::make_shared<CallBudget>(CallLimits{10, 100}, shared);
  auto one = first->take(101);
  ASSERT_TRUE(one);
  EXPECT_FALSE(first->take(0));
  EXPECT_FALSE(second->take(0)) << "around it there is another";
  one.reset();
  EXPECT_TRUE(second->take(1000));
}

}  // namespace
}  // namespace docuvend::linux_platform
