// An application that may open one file asks for it again and again, and takes no answer. Each answer is a descriptor of the daemon's until
// it lies in a socket, and one of all the user's processes' there.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <algorithm>
#include <filesystem>
#include <iterator>

#include "platform/linux/base/Sanitizers.h"
#include "platform/linux/rpc/ConnectionLimiter.h"
#include "tests/attacks/FileAttackTest.h"

namespace docuvend::tests {
namespace {

using linux_platform::kMaximumUntakenDescriptors;
using ::testing::ElementsAre;

// What the user's processes may have: enough for the daemon, and few enough to be used up.
constexpr rlim_t kDescriptors = 1024;
constexpr std::size_t kConnections = 60;
// More than the narrowest of buffers, and than a connection's answers without any limit on descriptors would need for that.
constexpr std::size_t kRequests = 400;

class UntakenFiles : public FileAttackTest {
 protected:
  void SetUp() override {
    rlimit limit{};
    ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &limit), 0);
    limit.rlim_max = std::min(limit.rlim_max, kDescriptors);
    limit.rlim_cur = std::min(limit.rlim_cur, limit.rlim_max);
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &limit), 0);
    FileAttackTest::SetUp();
    if (HasFatalFailure()) return;
    house_.install(kEditor);
    note_ = house_.granted(house_.putInCloud("note.txt", "Dear all\n"), kEditor);
    const Tokens tokens = grant(url(put("letter.txt")));
    ASSERT_TRUE(tokens.item);
    token_ = tokens.item->text();
  }

  [[nodiscard]] std::size_t descriptorsOfTheDaemon() {
    const std::filesystem::directory_iterator all("/proc/" + std::to_string(house_.daemon().pid()) + "/fd");
    return static_cast<std::size_t>(std::distance(begin(all), end(all)));
  }
  void expectOthersAreServed() {
    EXPECT_EQ(house_.confined(kEditor, {"show", note_}).output, "Dear all\n");
    const Ending listed = house_.ctl({"grants"});
    EXPECT_EQ(listed.status, 0) << listed.errors;
    EXPECT_EQ(house_.loggedContaining("Refusing connections"), 0);
    EXPECT_EQ(house_.loggedContaining("was not given an open file"), 0);
  }

  std::string note_;
  std::string token_;
};

TEST_F(UntakenFiles, AreFewAndOthersAreGivenTheirs) {
  const std::size_t before = descriptorsOfTheDaemon();
  const auto attacker = holdingAttacker({"leave", token_, std::to_string(kConnections), std::to_string(kRequests)}, "untaken");
  EXPECT_LE(descriptorsOfTheDaemon(), before + 2 * kConnections + kMaximumUntakenDescriptors) << "a socket and a process's for each";
  expectOthersAreServed();
  EXPECT_THAT(letGo(*attacker, "untaken"), ElementsAre("ok"));
  EXPECT_THAT(attack({"collect", token_, "100"}), ElementsAre("100 files")) << "and who takes them has them all";
}

TEST_F(UntakenFiles, OfAnApplicationThatShutsItsReadingHalvesAreNone) {
  const std::size_t before = descriptorsOfTheDaemon();
  const auto attacker = holdingAttacker({"leave-shut", token_, std::to_string(kConnections), std::to_string(kRequests)}, "shut");
  EXPECT_LE(descriptorsOfTheDaemon(), before + 2 * kConnections);
  expectOthersAreServed();
  EXPECT_THAT(letGo(*attacker, "shut"), ElementsAre("ok"));
}

TEST_F(UntakenFiles, CountWhenTheDaemonHasEndedTheirConnections) {
  if (linux_platform::kAddressSanitizer) GTEST_SKIP() << "the sanitizer looks at memory through descriptors of its own";
  constexpr int kAtATime = 30;
  constexpr int kRounds = 30;
  const auto attacker = holdingAttacker({"leave-ended", token_, std::to_string(kAtATime), std::to_string(kRounds)}, "ended");
  expectOthersAreServed();
  EXPECT_THAT(letGo(*attacker, "ended"), ElementsAre("EMFILE")) << "it had all the connections that it could";
  EXPECT_THAT(attack({"collect", token_, "10"}), ElementsAre("10 files")) << "what has left counts no more";
}

}  // namespace
}  // namespace docuvend::tests
