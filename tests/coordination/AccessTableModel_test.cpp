// Random accesses to few files by few processes, against what must hold whatever happened before.
#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "platform/linux/coordination/AccessTable.h"
#include "tests/coordination/Turns.h"
#include "tests/support/Sanitizers.h"
#include "tests/support/Seed.h"

namespace docuvend::linux_platform {
namespace {

using Entry = AccessTable::Entry;
using Numbers = std::vector<AccessNumber>;

constexpr int kSequences = tests::kSanitized ? 20 : 200;
constexpr int kSteps = 400;
constexpr std::uint8_t kProcesses = 4;
constexpr int kPartiesOfAProcess = 2;
constexpr int kFiles = 4;

// Whether parties do one thing after another, or ask for more while they wait.
enum class Parties { sequential, careless };

struct Asked {
  FileKey file;
  AccessKind kind;
  AccessParty party;
};

class Sequence {
 public:
  Sequence(std::uint32_t seed, Parties parties) : random_(seed), parties_(parties) {}

  void run() {
    for (int step = 0; step < kSteps && !::testing::Test::HasFailure(); ++step) {
      const int choice = upTo(16);
      if (choice < 10) {
        enterSomething();
      } else {
        leaveSomething(choice < 15 ? Leaving::oneThatHasTheTurn : Leaving::any);
      }
      expectTheInvariants();
    }
  }
  [[nodiscard]] int refused() const { return refused_; }

 private:
  int upTo(int bound) { return static_cast<int>(random_() % static_cast<unsigned>(bound)); }

  [[nodiscard]] bool is(const AccessTable& table, AccessTable::State state) const {
    const auto states = table.of(asked_.at(state.number).file);
    return std::find(states.begin(), states.end(), state) != states.end();
  }
  [[nodiscard]] bool has(const AccessTable& table, AccessNumber number) const { return is(table, {number, /*hasTurn=*/true}); }
  [[nodiscard]] bool waits(const AccessTable& table, const AccessParty& party) const {
    return std::any_of(asked_.begin(), asked_.end(), [this, &table, &party](const auto& asked) {
      return asked.second.party == party && is(table, {asked.first, /*hasTurn=*/false});
    });
  }

  void enterSomething() {
    const AccessParty party = testing::partyOf(static_cast<std::uint8_t>(1 + upTo(kProcesses)), upTo(kPartiesOfAProcess));
    if (parties_ == Parties::sequential && waits(table_, party)) return;
    const FileKey file = testing::fileNamed(std::to_string(upTo(kFiles)));
    const AccessKind kind = upTo(5) < 3 ? AccessKind::reading : AccessKind::writing;
    const auto before = table_.of(file);
    AccessTable others = table_;
    const Entry entry = table_.enter(++last_, file, kind, party);
    if (entry != Entry::wouldDeadlock) {
      asked_.emplace(last_, Asked{file, kind, party});
      if (entry == Entry::waits) expectAnEnd();
      return;
    }
    ++refused_;
    EXPECT_EQ(table_.of(file), before);
    // One that goes before those who queue may be refused because it goes before them.
    const bool goesBefore = others.hasTurn(party.process, file) && !before.back().hasTurn;
    if (parties_ == Parties::careless || goesBefore) return;
    drain(others, party);
    EXPECT_EQ(others.enter(last_, file, kind, party), Entry::wouldDeadlock) << "refused, but the wait had an end";
  }

  enum class Leaving { oneThatHasTheTurn, any };
  void leaveSomething(Leaving leaving) {
    if (asked_.empty()) return;
    const auto chosen = std::next(asked_.begin(), upTo(static_cast<int>(asked_.size())));
    const AccessNumber number = chosen->first;
    if (leaving == Leaving::oneThatHasTheTurn && !has(table_, number)) return;
    const FileKey file = chosen->second.file;
    const auto before = table_.of(file);
    asked_.erase(chosen);
    const Numbers come = table_.leave(number);
    Numbers expected;
    for (const auto& state : table_.of(file)) {
      const auto was = std::find_if(before.begin(), before.end(), [&state](const auto& other) { return other.number == state.number; });
      ASSERT_NE(was, before.end());
      if (state.hasTurn && !was->hasTurn) expected.push_back(state.number);
      EXPECT_TRUE(state.hasTurn || !was->hasTurn) << state.number << " lost its turn";
    }
    EXPECT_EQ(come, expected);
  }

  void expectAnEnd() const {
    AccessTable future = table_;
    drain(future, /*except=*/{});
    EXPECT_TRUE(future.isEmpty()) << "those that can end have ended, and some still wait";
  }

  // Those that have a turn end it, if their party does not wait; one party does nothing.
  void drain(AccessTable& table, const std::optional<AccessParty>& except) const {
    for (bool goesOn = true; goesOn;) {
      goesOn = false;
      for (const auto& [number, asked] : asked_) {
        if (!has(table, number)) continue;
        if (asked.party == except || (parties_ == Parties::sequential && waits(table, asked.party))) continue;
        (void)table.leave(number);
        goesOn = true;
      }
    }
  }

  [[nodiscard]] bool exclude(AccessNumber one, AccessNumber other) const {
    const Asked& first = asked_.at(one);
    const Asked& second = asked_.at(other);
    return first.party.process != second.party.process && (first.kind == AccessKind::writing || second.kind == AccessKind::writing);
  }

  void expectTheInvariants() {
    std::size_t known = 0;
    for (int name = 0; name < kFiles; ++name) {
      const FileKey file = testing::fileNamed(std::to_string(name));
      const auto states = table_.of(file);
      known += states.size();
      const auto firstWaiting = std::find_if(states.begin(), states.end(), [](const auto& state) { return !state.hasTurn; });
      for (auto state = states.begin(); state != states.end(); ++state) {
        ASSERT_TRUE(asked_.contains(state->number));
        EXPECT_EQ(asked_.at(state->number).file, file);
        EXPECT_EQ(state->hasTurn, state < firstWaiting);
        for (auto other = states.begin(); other != firstWaiting && state < firstWaiting; ++other) {
          EXPECT_FALSE(exclude(state->number, other->number)) << state->number << " and " << other->number << " have the turn";
        }
      }
      if (firstWaiting == states.end()) continue;
      EXPECT_TRUE(std::any_of(states.begin(), firstWaiting,
                              [this, firstWaiting](const auto& state) { return exclude(state.number, firstWaiting->number); }))
          << firstWaiting->number << " waits and could go";
      expectTheOrder({firstWaiting, states.end()});
    }
    EXPECT_EQ(known, asked_.size());
    EXPECT_EQ(table_.isEmpty(), asked_.empty());
  }

  // Whoever stands before one that came earlier writes, and its process has or had the turn when it came.
  void expectTheOrder(const std::vector<AccessTable::State>& waiting) {
    for (std::size_t i = 1; i < waiting.size(); ++i) {
      if (waiting[i - 1].number < waiting[i].number) continue;
      EXPECT_EQ(asked_.at(waiting[i - 1].number).kind, AccessKind::writing) << waiting[i - 1].number << " has passed others";
    }
  }

  std::mt19937 random_;
  const Parties parties_;
  AccessTable table_;
  std::map<AccessNumber, Asked> asked_;  // what is in the table
  AccessNumber last_ = 0;
  int refused_ = 0;
};

void runManySequences(Parties parties) {
  const std::uint32_t seed = tests::seedOfThisRun();
  int refused = 0;
  for (int i = 0; i < kSequences && !::testing::Test::HasFailure(); ++i) {
    SCOPED_TRACE("seed " + std::to_string(seed) + ", sequence " + std::to_string(i));
    Sequence sequence(seed + static_cast<std::uint32_t>(i), parties);
    sequence.run();
    refused += sequence.refused();
  }
  EXPECT_GT(refused, 0) << "no sequence came near a cycle";
}

TEST(AccessTableModel, NeverLetsTwoWhoExcludeEachOtherNorKeepsWhoCouldGoNorRefusesAWaitThatEnds) { runManySequences(Parties::sequential); }

TEST(AccessTableModel, KeepsTurnsApartAlsoForPartiesThatAskWhileTheyWait) { runManySequences(Parties::careless); }

}  // namespace
}  // namespace docuvend::linux_platform
