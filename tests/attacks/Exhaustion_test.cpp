// To use up what the system gives a user: processes, and descriptors that lie in sockets. And to spoil a file for those who come after.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <system_error>

#include "platform/linux/launch/LaunchArguments.h"
#include "tests/attacks/AttackTest.h"

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

// What the user may have while a test runs, beside what he has: room for the daemon, its extensions and a few clients, also where a
// sanitizer starts a thread in every process, and little enough to be used up.
constexpr rlim_t kProcesses = 600;

// Of this user, threads included. What ends meanwhile is not there.
rlim_t processesNow() {
  rlim_t count = 0;
  std::error_code error;
  for (const auto& process : std::filesystem::directory_iterator("/proc")) {
    struct stat status {};
    if (::stat(process.path().c_str(), &status) != 0 || status.st_uid != ::geteuid()) continue;
    for (std::filesystem::directory_iterator task(process.path() / "task", error), end; !error && task != end; task.increment(error))
      ++count;
  }
  return count;
}

class Exhaustion : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    rlimit limit{};
    ASSERT_EQ(::getrlimit(RLIMIT_NPROC, &limit), 0);
    limit.rlim_cur = std::min(limit.rlim_cur, processesNow() + kProcesses);
    ASSERT_EQ(::setrlimit(RLIMIT_NPROC, &limit), 0);
    installAttacker();
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
  }
  void startDaemonAndGrant() {
    house_.startDaemon();
    letterString_ = house_.granted(letter_, kEditor);
  }

  std::string letter_;
  std::string letterString_;
};

TEST_F(Exhaustion, AnApplicationThatForksWithoutEndLeavesProcessesForEverybodyElse) {
  startDaemonAndGrant();
  const auto attacker = holdingAttacker({"fork"}, "forks");
  EXPECT_EQ(house_.confined(kEditor, {"show", letterString_}).output, "Dear all\n");
  house_.installTrickster();
  EXPECT_TRUE(house_.awaitLog("Registered docuvend extension " + kTrickster)) << "a new extension is started";
  EXPECT_TRUE(house_.daemon().isRunning());
  EXPECT_THAT(letGo(*attacker, "forks"), ElementsAre("EAGAIN"));
}

TEST_F(Exhaustion, AnApplicationThatLeavesDescriptorsUnreadKeepsNobodyFromBeingGivenAFile) {
  startDaemonAndGrant();
  const auto attacker = holdingAttacker({"pass-around"}, "descriptors");
  EXPECT_EQ(house_.confined(kEditor, {"show", letterString_}).output, "Dear all\n");
  EXPECT_THAT(letGo(*attacker, "descriptors"), ElementsAre("ETOOMANYREFS"));
}

// All that share the user's number of them have it together.
TEST_F(Exhaustion, SeveralThatLeaveDescriptorsUnreadLeaveNoMoreThanOne) {
  startDaemonAndGrant();
  const auto first = holdingAttacker({"pass-around"}, "first");
  const auto second = holdingAttacker({"pass-around"}, "second");
  EXPECT_EQ(house_.confined(kEditor, {"show", letterString_}).output, "Dear all\n");
  EXPECT_THAT(letGo(*first, "first"), ElementsAre("ETOOMANYREFS"));
  EXPECT_THAT(letGo(*second, "second"), ElementsAre("ETOOMANYREFS"));
}

TEST_F(Exhaustion, ADaemonThatGetsNoThreadsSaysSoAtItsStart) {
  const Ending ending =
      Process({{"/usr/bin/prlimit", "--nproc=1:1", std::string(DOCUVEND_BIN) + "/docuvendd"}, house_.environment(), {}}).wait();
  EXPECT_NE(ending.status, 0);
  EXPECT_THAT(ending.errors, HasSubstr("docuvendd: QXSystemErrorDomain 11: cannot begin a thread"));
}

TEST_F(Exhaustion, ABearerThatTakesAllPermissionFromAFileKeepsNobodyFromIt) {
  startDaemonAndGrant();
  const std::string attackers = house_.granted(letter_, kAttacker);
  for (const char* mode : {"0", "400"}) {
    EXPECT_THAT(attack({"resolve", attackers, "open", "read", "mode", mode}), ElementsAre(::testing::_, "ok", "ok"));
    EXPECT_EQ(house_.confined(kEditor, {"show", letterString_}).output, "Dear all\n") << mode;
    EXPECT_THAT(attack({"resolve", attackers, "open", "write"}), ElementsAre(::testing::_, "ok")) << mode;
  }
}

}  // namespace
}  // namespace docuvend::tests
