#include "platform/linux/wire/CallBudget.h"

#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

TEST(CallBudget, GivesNoMoreThanItsLimitUntilAShareComesBack) {
  const auto budget = std::make_shared<CallBudget>(2U);
  auto one = budget->take();
  const auto two = budget->take();
  ASSERT_TRUE(one && two);
  EXPECT_FALSE(budget->take());
  EXPECT_FALSE(budget->take());
  one.reset();
  one = budget->take();
  EXPECT_TRUE(one);
  EXPECT_FALSE(budget->take());
}

TEST(CallBudget, WhatOneTakesIsMissingInAnotherThatLiesWithinTheSame) {
  const auto shared = std::make_shared<CallBudget>(2U);
  const auto first = std::make_shared<CallBudget>(2U, shared);
  const auto second = std::make_shared<CallBudget>(2U, shared);
  auto one = first->take();
  const auto two = second->take();
  ASSERT_TRUE(one && two);
  EXPECT_FALSE(first->take());
  EXPECT_FALSE(second->take());
  one.reset();
  EXPECT_TRUE(second->take());
}

TEST(CallBudget, ARefusalTakesNothing) {
  const auto shared = std::make_shared<CallBudget>(2U);
  const auto full = std::make_shared<CallBudget>(1U, shared);
  auto one = full->take();
  ASSERT_TRUE(one);
  EXPECT_FALSE(full->take());
  const auto two = shared->take();
  EXPECT_TRUE(two) << "refused by itself, it had asked nothing of what is around it";
  one.reset();
  auto three = shared->take();
  ASSERT_TRUE(three);
  EXPECT_FALSE(full->take());
  three.reset();
  EXPECT_TRUE(full->take()) << "refused by what is around it, it kept nothing of its own";
}

TEST(CallBudget, AShareOutlivesWhoeverGaveIt) {
  const auto shared = std::make_shared<CallBudget>(1U);
  auto share = std::make_shared<CallBudget>(1U, shared)->take();
  EXPECT_FALSE(shared->take());
  share.reset();
  EXPECT_TRUE(shared->take());
}

}  // namespace
}  // namespace docuvend::linux_platform
