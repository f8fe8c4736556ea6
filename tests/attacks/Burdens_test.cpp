// An application without any grant asks for what is dear to answer, over several connections, and takes no answer. The
// others are served meanwhile, and the daemon keeps little of what is not taken: it answers when it is.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "platform/linux/identity/KernelFacilities.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "tests/attacks/AttackTest.h"
#include "tests/support/Sanitizers.h"

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;

class Burdens : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    if (HasFatalFailure()) return;
    installAttacker();
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
  }
};

TEST_F(Burdens, OfAnswersThatAreNotTakenHoldUpNobodyAndEndWhenTheyAreTaken) {
  constexpr std::size_t kConnections = kSanitized ? 1 : 4;
  constexpr std::size_t kRequests = 80;  // each has about 70,000 bytes of answer: more than may be kept for a peer that is trusted
  const std::string letter = house_.putInCloud("letter.txt", "Dear all\n");
  house_.startDaemon("");
  const std::string string = house_.granted(letter, kEditor);
  const auto container = house_.container(kAttacker);
  Process attacker(Command{{std::string(DOCUVEND_BIN) + "/docuvend-run", kAttacker, "burden", std::to_string(kConnections),
                            std::to_string(kRequests), "hold", "burden", "relieve"},
                           house_.environment(),
                           {}});
  eventually("the burden is there", [&] { return std::filesystem::exists(container + "/burden.holding") || !attacker.isRunning(); });
  ASSERT_TRUE(attacker.isRunning());
  for (int i = 0; i < 3; ++i) {
    const Ending read = house_.ctl({"read", letter});
    EXPECT_EQ(read.output, "Dear all\n") << read.errors;
    EXPECT_EQ(house_.confined(kEditor, {"show", string}).output, "Dear all\n");
  }
  EXPECT_TRUE(attacker.isRunning());
  EXPECT_EQ(house_.loggedContaining("does not read"), 0) << "what is not taken never came to the bound";
  writeFile(container + "/burden.go", "");
  const Ending& ending = attacker.wait();
  EXPECT_THAT(linesOf(ending.output), ElementsAre("ok", "ok", std::to_string(kConnections * kRequests) + " answers")) << ending.errors;
}

// Closing it would be the daemon's affair, and takes as long as its sender likes.
TEST_F(Burdens, OfDescriptorsCannotBeSentToTheDaemon) {
  if (!linux_platform::KernelFacilities::probe().refusedDescriptors) GTEST_SKIP() << "the kernel passes them on (6.16 does not)";
  const std::string letter = house_.putInCloud("letter.txt", "Dear all\n");
  house_.startDaemon();
  for (const char* service : {kDVServiceName, linux_platform::kSandboxServiceName, linux_platform::kFileCoordinationServiceName}) {
    EXPECT_THAT(attack({"send", service}), ElementsAre("EPERM")) << service;
    EXPECT_THAT(attack({"hail", service}), ElementsAre("ok")) << service;
  }
  EXPECT_EQ(house_.confined(kEditor, {"show", house_.granted(letter, kEditor)}).output, "Dear all\n")
      << "the daemon sends descriptors itself";
}

}  // namespace
}  // namespace docuvend::tests
