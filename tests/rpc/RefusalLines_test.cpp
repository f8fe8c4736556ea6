#include "platform/linux/rpc/RefusalLines.h"

#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

using std::chrono::milliseconds;

constexpr RefusalLines::Time kStart{};

TEST(RefusalLinesTest, APeersFirstRefusalIsTold) {
  RefusalLines lines;
  EXPECT_TRUE(lines.isDue("one", kStart));
}

TEST(RefusalLinesTest, WhoKnocksAgainAndAgainIsToldOfOnceInAWhile) {
  RefusalLines lines;
  ASSERT_TRUE(lines.isDue("one", kStart));
  EXPECT_FALSE(lines.isDue("one", kStart));
  EXPECT_FALSE(lines.isDue("one", kStart + kTimeBetweenRefusalLines - milliseconds(1)));
  EXPECT_TRUE(lines.isDue("one", kStart + kTimeBetweenRefusalLines));
  EXPECT_FALSE(lines.isDue("one", kStart + kTimeBetweenRefusalLines));
}

TEST(RefusalLinesTest, NobodyHidesBehindAnother) {
  RefusalLines lines;
  ASSERT_TRUE(lines.isDue("one", kStart));
  ASSERT_FALSE(lines.isDue("one", kStart));
  EXPECT_TRUE(lines.isDue("two", kStart + milliseconds(1)));
  EXPECT_FALSE(lines.isDue("one", kStart + milliseconds(2)));
}

}  // namespace
}  // namespace docuvend::linux_platform
