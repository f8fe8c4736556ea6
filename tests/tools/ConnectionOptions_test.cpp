#include "tools/docuvendctl/ConnectionOptions.h"

#include <gtest/gtest.h>

namespace docuvend::ctl {
namespace {

using namespace std::chrono_literals;

TEST(ConnectionOptions, WithoutADeadlineTheLibrariesOwnHold) {
  EXPECT_EQ(consumerOptions(std::nullopt, std::nullopt).deadline, Consumer::Options().deadline);
  EXPECT_EQ(consumerOptions(std::nullopt, std::nullopt).materialisingDeadline, Consumer::Options().materialisingDeadline);
  EXPECT_EQ(administratorOptions(std::nullopt).deadline, Administrator::Options().deadline);
}

TEST(ConnectionOptions, ADeadlineHoldsForEveryCall) {
  EXPECT_EQ(consumerOptions(std::nullopt, 3s).deadline, 3s);
  EXPECT_EQ(consumerOptions(std::nullopt, 3s).materialisingDeadline, 3s);
  EXPECT_EQ(administratorOptions(3s).deadline, 3s);
}

TEST(ConnectionOptions, AConsumerActsForWhomTheCommandLineNames) {
  EXPECT_EQ(consumerOptions("org.b", std::nullopt).actAs, "org.b");
  EXPECT_EQ(consumerOptions(std::nullopt, std::nullopt).actAs, std::nullopt);
}

}  // namespace
}  // namespace docuvend::ctl
