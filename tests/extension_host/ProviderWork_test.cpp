#include "sdk/ProviderWork.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <future>
#include <memory>
#include <string>
#include <vector>

namespace docuvend {
namespace {

constexpr std::chrono::seconds kPatience{60};
constexpr std::chrono::milliseconds kNoPatience{0};

class ProviderWorkTest : public ::testing::Test {
 protected:
  ~ProviderWorkTest() override {
    gate.set_value();
    EXPECT_TRUE(work.finish(kPatience));
  }

  // Work that says that it runs and then waits for the test's end.
  std::function<void()> blocking(const std::shared_ptr<std::promise<void>>& runs) {
    return [runs, opened = opened] {
      runs->set_value();
      opened.wait();
    };
  }
  static bool comes(std::future<void> future) { return future.wait_for(kPatience) == std::future_status::ready; }

  std::promise<void> gate;
  std::shared_future<void> opened = gate.get_future().share();
  ProviderWork work;
};

TEST_F(ProviderWorkTest, WorkOfOneItemRunsOneAfterTheOtherInOrder) {
  std::vector<int> order;  // unguarded: that is what is tried
  std::promise<void> done;
  for (int i = 0; i < 200; ++i) {
    work.performForItem("a", [&order, i] { order.push_back(i); });
  }
  work.performForItem("a", [&done] { done.set_value(); });
  ASSERT_TRUE(comes(done.get_future()));
  ASSERT_EQ(order.size(), 200U);
  for (int i = 0; i < 200; ++i) EXPECT_EQ(order[static_cast<std::size_t>(i)], i);
}

TEST_F(ProviderWorkTest, AnItemWaitsForItsOwnWorkAndForNoOthers) {
  const auto runs = std::make_shared<std::promise<void>>();
  const auto second = std::make_shared<std::atomic<bool>>(false);
  work.performForItem("a", blocking(runs));
  ASSERT_TRUE(comes(runs->get_future()));
  work.performForItem("a", [second] { *second = true; });
  std::promise<void> other;
  work.performForItem("b", [&other] { other.set_value(); });
  EXPECT_TRUE(comes(other.get_future()));
  EXPECT_FALSE(*second);
}

TEST_F(ProviderWorkTest, NoNumberOfLongPiecesHoldsUpAQuickOne) {
  constexpr int kMany = 100;
  for (int i = 0; i < kMany; ++i) work.performForItem(std::to_string(i), blocking(std::make_shared<std::promise<void>>()));
  std::promise<void> quick;
  work.performQuick([&quick] { quick.set_value(); });
  EXPECT_TRUE(comes(quick.get_future()));
}

TEST(ProviderWork, FinishingDropsWhatHasNotBegunAndTellsWhetherSomethingStillRuns) {
  std::promise<void> runs;
  std::promise<void> gate;
  std::atomic<bool> second{false};
  ProviderWork work;
  work.performForItem("a", [&runs, &gate] {
    runs.set_value();
    gate.get_future().wait();
  });
  ASSERT_EQ(runs.get_future().wait_for(kPatience), std::future_status::ready);
  work.performForItem("a", [&second] { second = true; });
  EXPECT_FALSE(work.finish(kNoPatience));
  gate.set_value();
  EXPECT_TRUE(work.finish(kPatience));
  work.performQuick([&second] { second = true; });
  EXPECT_FALSE(second);
}

}  // namespace
}  // namespace docuvend
