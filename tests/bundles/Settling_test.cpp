#include "platform/linux/bundles/Settling.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <string>

namespace docuvend::linux_platform {
namespace {

using namespace std::chrono_literals;
using Duration = Settling::Duration;
using Found = Settling::Found;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr const char* kBundle = "/bundles/a";

class SettlingTest : public ::testing::Test {
 protected:
  // How long from now until the next look; none when there is none to come.
  [[nodiscard]] std::optional<Duration> untilNextLook() const {
    const auto next = settling_.nextLook();
    if (!next) return std::nullopt;
    return std::chrono::duration_cast<Duration>(*next - now_);
  }
  void pass(Duration time) { now_ += time; }
  void change() { settling_.changed(now_); }
  void write() {
    settling_.changed(now_);
    settling_.wasWritten(kBundle, now_);
  }
  void look(Found found) { settling_.looked(now_, found); }
  // A row of changes so long apart, each look finding something; the looks.
  int looksFor(int changes, Duration apart, const std::function<void(int)>& makeChange) {
    int looks = 0;
    for (int i = 0; i < changes; ++i) {
      makeChange(i);
      for (Duration left = apart; left > 0ms; left -= 1ms) {
        pass(1ms);
        if (untilNextLook() != 0ms) continue;
        look(Found::changes);
        ++looks;
      }
    }
    if (untilNextLook()) {
      pass(*untilNextLook());
      look(Found::changes);
      ++looks;
    }
    return looks;
  }

  Settling settling_;
  Settling::Time now_ = Settling::Time() + 1h;
};

TEST_F(SettlingTest, LooksAMomentAfterTheLastChange) {
  EXPECT_EQ(untilNextLook(), std::nullopt);
  change();
  EXPECT_EQ(untilNextLook(), Settling::kShortestQuiet);
  pass(15ms);
  change();
  EXPECT_EQ(untilNextLook(), Settling::kShortestQuiet);
  pass(Settling::kShortestQuiet);
  EXPECT_EQ(untilNextLook(), 0ms);
  look(Found::changes);
  EXPECT_EQ(untilNextLook(), std::nullopt);
}

TEST_F(SettlingTest, ChangesWithoutAPauseAreLookedAtAllTheSameEverMoreSeldom) {
  for (const Duration expected : {1'000ms, 2'000ms, 4'000ms, 4'000ms}) {
    for (Duration time = 0ms; time < expected; time += 10ms) {
      change();
      EXPECT_GT(untilNextLook(), 0ms);
      pass(10ms);
    }
    EXPECT_EQ(untilNextLook(), 0ms);
    look(Found::changes);
  }
  pass(Settling::kBusy + 1ms);
  for (Duration time = 0ms; time < Settling::kFirstWait; time += 10ms) {
    change();
    pass(10ms);
  }
  EXPECT_EQ(untilNextLook(), 0ms) << "soon again after calm";
}

TEST_F(SettlingTest, TheMomentGrowsWhileLooksFindChangesAndIsShortAgainAfterCalm) {
  for (const Duration expected : {20ms, 40ms, 80ms, 160ms, 160ms}) {
    change();
    EXPECT_EQ(untilNextLook(), expected);
    pass(expected);
    look(Found::changes);
  }
  pass(Settling::kBusy);
  change();
  EXPECT_EQ(untilNextLook(), Settling::kLongestQuiet);
  pass(Settling::kLongestQuiet);
  look(Found::nothingNew);
  change();
  EXPECT_EQ(untilNextLook(), Settling::kShortestQuiet);
}

TEST_F(SettlingTest, LooksThatFindNothingDoNotMakeTheMomentGrow) {
  for (int i = 0; i < 5; ++i) {
    change();
    EXPECT_EQ(untilNextLook(), Settling::kShortestQuiet);
    pass(Settling::kShortestQuiet);
    look(Found::nothingNew);
  }
}

TEST_F(SettlingTest, AHundredChangesAreSeenInFewLooksHoweverFarApart) {
  for (const Duration apart : {1ms, 15ms, 25ms, 50ms, 100ms, 150ms}) {
    const int looks = looksFor(100, apart, [this](int) { change(); });
    EXPECT_GE(looks, 1) << apart.count();
    EXPECT_LE(looks, 6 + 100 * apart / Settling::kLongestWait) << apart.count();
    pass(1h);
  }
}

TEST_F(SettlingTest, AHundredBundlesWrittenInPlaceOneAfterAnotherAreSeenInFewLooks) {
  for (const Duration apart : {5ms, 50ms, 150ms}) {
    const int looks = looksFor(100, apart, [this](int number) {
      settling_.changed(now_);
      settling_.wasWritten(kBundle + std::to_string(number), now_);
    });
    EXPECT_LE(looks, 7 + 100 * apart / Settling::kLongestWait) << apart.count();
    pass(1h);
    look(Found::nothingNew);
    EXPECT_EQ(untilNextLook(), std::nullopt);
  }
}

TEST_F(SettlingTest, ABundleThatIsWrittenIsUnsettledUntilItIsQuiet) {
  write();
  EXPECT_THAT(settling_.unsettled(now_), ElementsAre(kBundle));
  pass(Settling::kQuietInPlace - 1ms);
  write();
  pass(Settling::kShortestQuiet);
  EXPECT_EQ(untilNextLook(), 0ms) << "the other bundles are not held up";
  EXPECT_THAT(settling_.unsettled(now_), ElementsAre(kBundle));
  look(Found::nothingNew);
  pass(Settling::kQuietInPlace - Settling::kShortestQuiet);
  EXPECT_THAT(settling_.unsettled(now_), IsEmpty());
  EXPECT_EQ(untilNextLook(), Settling::kShortestQuiet) << "then that is a change like any other";
  pass(Settling::kShortestQuiet);
  look(Found::changes);
  EXPECT_EQ(untilNextLook(), std::nullopt);
}

TEST_F(SettlingTest, ABundleThatIsWrittenForEverIsLookedAtNowAndThen) {
  for (Duration time = 0ms; time < Settling::kLongestInPlace; time += 100ms) {
    write();
    EXPECT_THAT(settling_.unsettled(now_), ElementsAre(kBundle));
    pass(100ms);
    look(Found::nothingNew);
  }
  EXPECT_THAT(settling_.unsettled(now_), IsEmpty());
  write();
  EXPECT_THAT(settling_.unsettled(now_), ElementsAre(kBundle)) << "and then left alone again";
}

TEST_F(SettlingTest, ABundleThatComesAndGoesIsUnsettledUntilItStays) {
  const auto rename = [this] {
    settling_.changed(now_);
    settling_.wasRenamed(kBundle, now_);
  };
  rename();
  rename();
  EXPECT_THAT(settling_.unsettled(now_), IsEmpty()) << "one exchange is told as two renames";
  for (int i = 0; i < 5; ++i) {
    pass(150ms);
    rename();
    EXPECT_THAT(settling_.unsettled(now_), ElementsAre(kBundle));
    look(Found::nothingNew);
  }
  pass(Settling::kQuietInPlace);
  EXPECT_THAT(settling_.unsettled(now_), IsEmpty());
  pass(*untilNextLook());
  look(Found::changes);
  pass(Settling::kComesAndGoes + 1ms);
  rename();
  EXPECT_THAT(settling_.unsettled(now_), IsEmpty()) << "whole at once again";
}

TEST_F(SettlingTest, RenamesOfDifferentBundlesHoldNoneOfThemUp) {
  settling_.wasRenamed("/bundles/b", now_);
  pass(10ms);
  settling_.wasRenamed(kBundle, now_);
  EXPECT_THAT(settling_.unsettled(now_), IsEmpty());
}

TEST_F(SettlingTest, ABundleThatIsRenamedIsWhole) {
  write();
  settling_.wasRenamed(kBundle, now_);
  EXPECT_THAT(settling_.unsettled(now_), IsEmpty());
  EXPECT_EQ(untilNextLook(), Settling::kShortestQuiet);
}

}  // namespace
}  // namespace docuvend::linux_platform
