// Flooding: applications without any grant send as much as they can of what everybody may send. A provider is not ended for it, the log
// stays readable, and who has no identity takes nothing from those who have one.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <algorithm>
#include <chrono>
#include <filesystem>

#include "common/DVLog.h"
#include "platform/linux/log/LogAllowance.h"
#include "platform/linux/rpc/ConnectionLimiter.h"
#include "tests/attacks/AttackTest.h"

namespace docuvend::tests {
namespace {

using linux_platform::kMaximumConnectionsOfNobody;
using linux_platform::LogAllowance;
using ::testing::ElementsAre;

const std::string kAccomplice = "com.orvane.accomplice";
const std::string kRefusals = "[ERROR] Could not extend bookmark privileges for URL ";

class Floods : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    if (HasFatalFailure()) return;
    installAttacker();
    house_.install(kAccomplice, "docuvend-attacker", stringEntry("QXBundleIdentifier", kAccomplice), {});
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
  }

  [[nodiscard]] std::unique_ptr<Process> start(const std::string& bundle, std::vector<std::string> words) const {
    words.insert(words.begin(), {std::string(DOCUVEND_BIN) + "/docuvend-run", bundle});
    return std::make_unique<Process>(Command{words, house_.environment(), {}});
  }
  [[nodiscard]] static std::vector<std::string> linesOf(Process& process) {
    const Ending& ending = process.wait();
    EXPECT_EQ(ending.status, 0) << ending.errors;
    return tests::linesOf(ending.output);
  }
  void expectTheLetterIsRead() const {
    const Ending read = house_.ctl({"read", letter_});
    EXPECT_EQ(read.output, "Dear all\n") << read.errors;
  }

  std::string letter_;
};

TEST_F(Floods, OfLengthyRequestsDoNotEndTheProviderThatTheyAreFor) {
  house_.startDaemon("");
  expectTheLetterIsRead();
  const auto before = house_.processesOf("cellar");
  ASSERT_EQ(before.size(), 1U);
  const std::vector<std::string> words = {"pile", house_.storage(kCellar), "4", "500"};
  const auto first = start(kAttacker, words);
  const auto second = start(kAccomplice, words);
  do {
    expectTheLetterIsRead();
  } while (first->isRunning() || second->isRunning());
  EXPECT_THAT(linesOf(*first), ElementsAre("ok"));
  EXPECT_THAT(linesOf(*second), ElementsAre("ok"));
  EXPECT_EQ(house_.processesOf("cellar"), before);
  EXPECT_EQ(house_.loggedContaining("The process of com.orvane.cellar "), 0);
}

TEST_F(Floods, TheDeadHaveFewConnectionsTogetherAndMayWakeTheDaemonAndNothingElse) {
  constexpr int kMore = 5;
  house_.startDaemon();
  expectTheLetterIsRead();
  house_.daemon().signal(SIGSTOP);
  const auto attacker = start(kAttacker, {"gather", kDVServiceName, std::to_string(kMaximumConnectionsOfNobody + kMore), "hold", "dead",
                                          "survey", letter_, "hold", "alive"});
  eventually("the dead have connected", [this, &attacker] {
    return std::filesystem::exists(house_.container(kAttacker) + "/dead.holding") || !attacker->isRunning();
  });
  house_.daemon().signal(SIGCONT);
  writeFile(house_.container(kAttacker) + "/dead.go", "");
  eventually("they have been answered", [this, &attacker] {
    return std::filesystem::exists(house_.container(kAttacker) + "/alive.holding") || !attacker->isRunning();
  });
  EXPECT_THAT(attack({"crowd", kDVServiceName, "1"}), ElementsAre("1 served, 0 refused")) << "the living have their own";
  expectTheLetterIsRead();
  writeFile(house_.container(kAttacker) + "/alive.go", "");
  EXPECT_THAT(linesOf(*attacker), ElementsAre("ok", "ok", std::to_string(kMore) + " refused; an answer, QXRpcErrorDomain 10", "ok"));
  EXPECT_EQ(house_.loggedContaining(" is nobody: "), static_cast<int>(kMaximumConnectionsOfNobody) + kMore);
}

TEST_F(Floods, OfLinesAreCutAndOthersAreStillToldOf) {
  constexpr std::size_t kMany = 10 * LogAllowance::kLinesAtOnce;
  house_.startDaemon("");
  const auto began = std::chrono::steady_clock::now();
  EXPECT_THAT(attack({"nag", std::to_string(kMany)}), ElementsAre("ok"));
  const Ending other = house_.confined(kAccomplice, {"pass-on", letter_, "com.orvane.friend"});
  EXPECT_EQ(other.output, "DVErrorDomain 2\n");
  const auto back = static_cast<std::size_t>((std::chrono::steady_clock::now() - began) / LogAllowance::kTimeForALine) + 1;
  std::size_t lines = 0;
  for (const std::string& line : house_.log()) {
    if (!line.starts_with(kRefusals) || line.find(kAccomplice) != std::string::npos) continue;
    ++lines;
    EXPECT_LE(line.size(), 2 * kDVLongestLoggedValue) << line;
  }
  EXPECT_GE(lines, LogAllowance::kLinesAtOnce);
  EXPECT_LE(lines, LogAllowance::kLinesAtOnce + back);
  EXPECT_EQ(house_.loggedContaining(" from bundle " + kAccomplice + " to consumer ID com.orvane.friend"), 1);
}

// Its provider is in league with it, and fails whenever it is asked.
TEST_F(Floods, OfCoordinatedReadsThatFailAreCutInTheLogAndOthersAreStillToldOf) {
  constexpr std::size_t kMany = 4 * LogAllowance::kLinesAtOnce;
  const std::string failure = "[ERROR] Proxy failed to start providing item at URL ";
  house_.installTrickster();
  house_.startDaemon("");
  const auto grantSour = [this](const std::string& consumer) {
    const std::string path = house_.storage(kTrickster) + "/sour";
    EXPECT_EQ(house_.confined(kPicker, {"grant", path, kTrickster, consumer}).status, 0);
    return house_.bookmark(path);
  };
  const std::string string = grantSour(kAttacker);
  (void)grantSour(kAccomplice);
  const auto began = std::chrono::steady_clock::now();
  EXPECT_THAT(attack({"misread", string, std::to_string(kMany)}), ElementsAre(std::to_string(kMany)));
  const auto back = static_cast<std::size_t>((std::chrono::steady_clock::now() - began) / LogAllowance::kTimeForALine) + 1;
  const auto lines = static_cast<std::size_t>(house_.loggedContaining(failure));
  EXPECT_GE(lines, LogAllowance::kLinesAtOnce);
  EXPECT_LE(lines, LogAllowance::kLinesAtOnce + back);
  EXPECT_EQ(house_.confined(kAccomplice, {"misread", string, "1"}).output, "1\n");
  EXPECT_EQ(static_cast<std::size_t>(house_.loggedContaining(failure)), lines + 1);
}

}  // namespace
}  // namespace docuvend::tests
