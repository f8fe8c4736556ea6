// Two hundred processes that take turns at twenty documents of a real provider, some of which are killed at random.
//
// The environment variables DOCUVEND_CROWD_SECONDS and DOCUVEND_HANG_ROUNDS make the two longer, for a run by hand.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "tests/support/Sanitizers.h"
#include "tests/system/house/Burden.h"
#include "tests/system/house/TurnTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::AllOf;
using ::testing::Ge;
using ::testing::Le;

constexpr long kSeconds = 5;
constexpr long kRounds = 20;
constexpr int kItems = 20;
// A process with a sanitizer takes many times the memory, and many times as long to start.
constexpr int kMembers = kSanitized ? 40 : 200;
// A ledger without an entry, as turntaker/Ledger.cpp writes it.
constexpr const char* kEmptyLedger = "sum 14695981039346656037 of 0\n";

long given(const char* variable, long otherwise) {
  const char* value = std::getenv(variable);
  return value == nullptr ? otherwise : std::stol(value);
}

class CoordinationCrowd : public TurnTest {
 protected:
  [[nodiscard]] Burden burden() { return burdenOf(house_.daemon().pid()); }
  [[nodiscard]] Command turntaker(const std::vector<std::string>& words) const {
    Command command{{std::string(DOCUVEND_BIN) + "/docuvend-turntaker"}, house_.environment(), {}};
    command.words.insert(command.words.end(), words.begin(), words.end());
    return command;
  }
  // "name: figure" lines.
  static std::map<std::string, int> figures(const std::string& output) {
    std::map<std::string, int> result;
    std::istringstream lines(output);
    for (std::string line; std::getline(lines, line);) {
      const std::size_t colon = line.find(": ");
      if (colon != std::string::npos) result[line.substr(0, colon)] = std::stoi(line.substr(colon + 2));
    }
    return result;
  }
};

TEST_F(CoordinationCrowd, LosesNoUpdateSeesNoHalfWriteAndLeavesNobodyBehind) {
  std::vector<QXURL> items;
  for (int i = 0; i < kItems; ++i) {
    items.push_back(url(house_.putInCloud("ledger-" + std::to_string(i), kEmptyLedger)));
    ASSERT_EQ(answers({"reading", items.back().absoluteString(), "end"}).front(), "ok");
  }
  const long seconds = given("DOCUVEND_CROWD_SECONDS", kSeconds);
  const std::string directory = place("crowd");
  fs::create_directory(directory);
  std::vector<std::string> words = {"crowd", std::to_string(seconds * 1000), std::to_string(kMembers), directory};
  for (const QXURL& item : items) words.push_back(item.fileSystemPath());
  const Burden before = burden();
  Process crowd(turntaker(words));
  // Longer than a program usually may take.
  EXPECT_TRUE(crowd.hasEndedWithin(static_cast<int>((seconds + std::chrono::seconds(2 * kPatience).count()) * 1000)));
  const Ending& ended = crowd.wait();
  ASSERT_EQ(ended.status, 0) << ended.errors;
  EXPECT_EQ(ended.errors, "");
  auto count = figures(ended.output);
  EXPECT_GT(count["reads"], 0);
  EXPECT_GT(count["writes"], 0);
  EXPECT_GT(count["kills"], 0);

  for (const QXURL& item : items) awaitHolders(item, {});
  const int tellings = house_.loggedBeginning("[INFO] QXFileCoordinator is telling us ");
  EXPECT_THAT(tellings, AllOf(Ge(1), Le(count["writes"] + count["killed writes"] + count["perhaps killed writes"])))
      << "of no write that had begun the provider is told twice";
  for (const QXURL& item : items) {
    const std::string name = fs::path(item.fileSystemPath()).filename();
    eventually("the cloud has " + name, [&] { return contentsOf(house_.cloudFile(name)) == contentsOf(item.fileSystemPath()); });
  }
  Burden after;
  eventually("the daemon bears no more than before", [&] {
    after = burden();
    return after.descriptors <= before.descriptors && after.processes <= before.processes;
  });
  std::cout << seconds << " s, " << kMembers << " members, " << kItems << " items\n"
            << ended.output << "tellings: " << tellings << "\ndescriptors: " << before.descriptors << ", " << after.descriptors
            << "\nprocesses: " << before.processes << ", " << after.processes << "\nbefore " << before.memory << "\nafter " << after.memory
            << "\n";
}

TEST_F(CoordinationCrowd, ReadsOfOneProvidersItemSucceedWhileAnotherProviderHangs) {
  Process measure(turntaker({"hang", std::to_string(given("DOCUVEND_HANG_ROUNDS", kRounds)), letter_.absoluteString(),
                             trick("stuck").absoluteString(), house_.container(kTrickster) + "/free"}));
  const Ending& ended = measure.wait();
  EXPECT_EQ(ended.status, 0) << ended.errors;
  std::cout << ended.output;
}

}  // namespace
}  // namespace docuvend::tests
