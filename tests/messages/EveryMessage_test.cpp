// Runs every test of the rooms' suites once more, each in a process of its own as always, and holds what they asserted of the log against
// what the sources can write.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <fstream>
#include <iostream>
#include <mutex>
#include <set>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "tests/files/TemporaryDirectory.h"
#include "tests/messages/catalogue/Catalogue.h"
#include "tests/system/house/Process.h"

namespace docuvend::tests {
namespace {

using fake_platform::AssertedMessage;

constexpr int kPatienceWithATest = 120'000;  // milliseconds

struct Suite {
  const char* program;
  const char* filter;  // of its tests
};

// Of the platform's rooms, those that write messages, without the tests that take long and assert none. What is said where everything is
// put together is heard only from the program itself.
constexpr Suite kSuites[] = {
    {"acl_tests", "*"},
    {"providers_tests", "*"},
    {"service_tests", "*"},
    {"daemon_tests", "*"},
    {"bundles_tests", "*-BundleInstaller*:OfEitherKind/*/Watches"},
    {"coordination_tests", "*-AccessTableModel.*:ChangeNoticesTest.*"},
    {"extension_host_tests", "*-ExtensionLivenessTest.*:ProvidersOverProcesses.*"},
    {"launch_tests", "LinuxPeerDirectoryTest.*"},
    {"log_tests", "LinuxLogTest.WhatWasLeftOutIsToldWhenItIsDue"},
    {"rpc_tests", "*"},
    {"sandbox_tests", "*-Of/SwapRace.*:TokenRedeemerTest.*"},
    {"system_tests",
     "Start.SaysSoWithItsProgramsPath:Administration.TheStatusSaysHowTheDaemonIs:Bundles.WhatABundleLeavesIsToldOfWhenItCannotBeWritten"}};

struct OneTest {
  std::string program;
  std::string name;
};

std::string pathOf(const std::string& program) { return std::string(DOCUVEND_BIN) + "/" + program; }

std::vector<std::string> environmentOfThisProcess() {
  std::vector<std::string> environment;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    if (!std::string_view(*entry).starts_with("GTEST_")) environment.emplace_back(*entry);
  }
  return environment;
}

// The listing has a line for each group, and one below it, further in, for each of its tests; a comment may follow both.
std::vector<OneTest> testsOf(const Suite& suite) {
  Process listing({.words = {pathOf(suite.program), "--gtest_list_tests", std::string("--gtest_filter=") + suite.filter},
                   .environment = environmentOfThisProcess(),
                   .input = {}});
  std::istringstream lines(listing.wait().output);
  std::vector<OneTest> tests;
  std::string group;
  for (std::string line; std::getline(lines, line);) {
    const std::string word = line.substr(line.find_first_not_of(' '), line.find("  #") - line.find_first_not_of(' '));
    if (!line.starts_with(' ')) {
      group = line.ends_with('.') || line.find(".  #") != line.npos ? word : "";
    } else if (!group.empty()) {
      tests.push_back({suite.program, group + word});
    }
  }
  return tests;
}

// Several at a time. What a test that fails has asserted does not count.
class Runs {
 public:
  explicit Runs(std::vector<OneTest> tests) : tests_(std::move(tests)) {
    const std::size_t atATime = std::clamp(std::thread::hardware_concurrency(), 2U, 8U);
    std::vector<std::jthread> threads;
    while (threads.size() < atATime) threads.emplace_back([this] { runSome(); });
  }

  std::set<AssertedMessage> asserted;
  std::vector<std::string> failed;

 private:
  void runSome() {
    for (std::size_t i = next_++; i < tests_.size(); i = next_++) {
      const std::string notes = directory_.path(std::to_string(i));
      const bool hasPassed = run(tests_[i], notes);
      const std::lock_guard lock(mutex_);
      if (hasPassed) {
        asserted.merge(fake_platform::assertedMessagesIn(notes));
      } else {
        failed.push_back(tests_[i].program + " " + tests_[i].name);
      }
    }
  }

  static bool run(const OneTest& test, const std::string& notes) {
    auto environment = environmentOfThisProcess();
    environment.push_back(std::string(fake_platform::kAssertedMessagesVariable).append("=").append(notes));
    Process process({.words = {pathOf(test.program), "--gtest_filter=" + test.name}, .environment = std::move(environment), .input = {}});
    return process.hasEndedWithin(kPatienceWithATest) && process.wait().status == 0;
  }

  const test::TemporaryDirectory directory_;
  const std::vector<OneTest> tests_;
  std::atomic<std::size_t> next_ = 0;
  std::mutex mutex_;  // guards what is public while threads run
};

TEST(EveryMessage, IsAssertedByATestWithItsLevelAndItsValuesAndNoOtherIs) {
  std::vector<OneTest> tests;
  for (const Suite& suite : kSuites) {
    const auto some = testsOf(suite);
    ASSERT_FALSE(some.empty()) << suite.program;
    tests.insert(tests.end(), some.begin(), some.end());
  }
  const Runs runs(tests);
  for (const std::string& test : runs.failed) ADD_FAILURE() << "a test fails: " << test;

  std::ifstream file(DOCUVEND_MESSAGES);
  const Catalogue catalogue = Catalogue::from(file);
  ASSERT_GT(catalogue.size(), 0U);
  const MessageFindings findings = catalogue.compare(runs.asserted);
  std::cout << "messages asserted " << findings.asserted << " of " << catalogue.size() << "\n";
  for (const std::string& message : findings.unasserted) ADD_FAILURE() << "no test asserts: " << message;
  for (const std::string& assertion : findings.unknown) ADD_FAILURE() << assertion;
}

}  // namespace
}  // namespace docuvend::tests
