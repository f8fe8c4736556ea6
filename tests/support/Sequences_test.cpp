#include "tests/support/Sequences.h"

#include <gmock/gmock.h>
#include <gtest/gtest-spi.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <stdexcept>

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

bool contains(const Sequence<int>& sequence, int step) { return std::find(sequence.begin(), sequence.end(), step) != sequence.end(); }

TEST(ShortestFailing, KeepsOnlyTheStepsThatTheFailureNeeds) {
  const SequenceTrial<int> trial = [](const Sequence<int>& sequence) {
    return contains(sequence, 3) && contains(sequence, 7) ? "both" : "";
  };
  EXPECT_THAT(shortestFailing({1, 2, 3, 4, 5, 6, 7, 8, 9}, trial), ElementsAre(3, 7));
}

TEST(ShortestFailing, TriesAgainWhatAnotherStepHeldBack) {
  const SequenceTrial<int> trial = [](const Sequence<int>& sequence) {
    return contains(sequence, 9) && (!contains(sequence, 8) || contains(sequence, 1)) ? "so" : "";
  };
  EXPECT_THAT(shortestFailing({1, 8, 9}, trial), ElementsAre(9)) << "the first step can go once the second is gone";
}

TEST(ShortestFailing, MayBeNothing) {
  EXPECT_THAT(shortestFailing<int>({1, 2, 3}, [](const Sequence<int>&) { return "always"; }), IsEmpty());
  EXPECT_THAT(shortestFailing<int>({}, [](const Sequence<int>&) { return "always"; }), IsEmpty());
}

TEST(InAProcess, BringsTheAnswerAndWhatWasSaid) {
  EXPECT_EQ(inAProcess([] { return std::string(); }), "");
  EXPECT_EQ(inAProcess([] {
              std::cerr << "said ";
              return std::string("answered");
            }),
            "said answered");
}

TEST(InAProcess, AnEndOfTheProcessIsAnAnswer) {
  EXPECT_THAT(inAProcess([]() -> std::string {
                ::raise(SIGKILL);
                return "";
              }),
              HasSubstr("ended by signal 9"));
  EXPECT_THAT(inAProcess([]() -> std::string { std::_Exit(3); }), HasSubstr("ended with 3"));
}

TEST(InAProcess, AnExceptionEndsTheProcess) {
  EXPECT_THAT(inAProcess([]() -> std::string { throw std::runtime_error("no"); }), HasSubstr("ended by signal 6"));
}

TEST(InAProcess, NothingThatIsChangedThereIsChangedHere) {
  int value = 1;
  EXPECT_EQ(inAProcess([&value] { return std::to_string(++value); }), "2");
  EXPECT_EQ(value, 1);
}

void tryTillFive(std::uint32_t fixed) {
  trySequences<int>(
      {.fixed = fixed, .random = 0},
      [](std::mt19937&) {
        return Sequence<int>{4, 5, 6};
      },
      [](const Sequence<int>& sequence) { return contains(sequence, 5) ? "five" : ""; },
      [](const int& step) { return std::to_string(step); });
}

TEST(TrySequences, FailsWithTheShortestSequenceAndWhatIsWrongWithIt) {
  EXPECT_NONFATAL_FAILURE(tryTillFive(3), "these 1 of its steps:\n  5\nfive");
}

TEST(TrySequences, MakesTheSameFixedSequencesInEveryRun) {
  std::vector<std::vector<std::uint32_t>> runs(2);
  for (auto& run : runs) {
    trySequences<int>(
        {.fixed = 2, .random = 1},
        [&run](std::mt19937& random) {
          run.push_back(random());
          return Sequence<int>{};
        },
        [](const Sequence<int>&) { return ""; }, [](const int&) { return ""; });
  }
  ASSERT_EQ(runs[0].size(), 3U);
  EXPECT_EQ(runs[0][0], runs[1][0]);
  EXPECT_EQ(runs[0][1], runs[1][1]);
  EXPECT_NE(runs[0][0], runs[0][1]);
}

}  // namespace
}  // namespace docuvend::tests
