// What the launcher and the daemon have open or set, and whether a confined process finds it.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <filesystem>

#include "tests/attacks/AttackTest.h"

namespace docuvend::tests {
namespace {

using linux_platform::UniqueDescriptor;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

class Leaks : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    installAttacker();
    writeFile(house_.home() + "/secret", "secret\n");
    // Left open on purpose: every program that this one starts has it, and so has what they start, unless they see to it. The first numbers
    // they take for what they pass on themselves, which would close it by chance.
    constexpr int kOutOfTheWay = 50;
    const UniqueDescriptor secret(::open((house_.home() + "/secret").c_str(), O_RDONLY | O_CLOEXEC));
    leaked_ = UniqueDescriptor(::fcntl(secret.get(), F_DUPFD, kOutOfTheWay));
    ASSERT_GE(leaked_.get(), kOutOfTheWay);
    // Something that a shell's user has, for the tests' programs inherit no environment of their own.
    house_.addToEnvironment("SECRET=x");
    house_.addToEnvironment("SSH_AUTH_SOCK=" + house_.runtime() + "/agent");
    house_.addToEnvironment("DBUS_SESSION_BUS_ADDRESS=unix:path=" + house_.runtime() + "/bus");
    house_.startDaemon();
  }

  [[nodiscard]] std::string leakedNumber() const { return std::to_string(leaked_.get()); }

  UniqueDescriptor leaked_;
};

TEST_F(Leaks, AnApplicationHasTheStandardDescriptorsAndNoneThatItsLauncherLeftOpen) {
  EXPECT_THAT(attack({"descriptors"}), ElementsAre("0 1 2"));
  EXPECT_THAT(unconfined({"descriptors"}), ElementsAre(HasSubstr(" " + leakedNumber())));
}

TEST_F(Leaks, AnExtensionHasItsConnectionAndNoOtherDescriptorOfTheDaemon) {
  const auto daemons = std::filesystem::path("/proc/" + std::to_string(house_.daemon().pid()) + "/fd");
  ASSERT_TRUE(std::filesystem::exists(daemons / leakedNumber())) << "the daemon has it";
  EXPECT_THAT(attackAsExtension({"descriptors"}), ElementsAre("0 1 2 3"));
}

TEST_F(Leaks, TheEnvironmentOfAnApplicationIsMadeForIt) {
  ASSERT_EQ(::setenv("SECRET", "x", 1), 0);
  EXPECT_THAT(attack({"variables"}), ElementsAre("HOME LANG PATH PWD TMPDIR XDG_RUNTIME_DIR"));
  const auto honest = unconfined({"variables"});
  ASSERT_EQ(honest.size(), 1U);
  for (const char* name : {"SECRET", "SSH_AUTH_SOCK", "DBUS_SESSION_BUS_ADDRESS"}) EXPECT_THAT(honest[0], HasSubstr(name));
}

TEST_F(Leaks, TheEnvironmentOfAnExtensionIsMadeForItToo) {
  const std::string daemons = contentsOf("/proc/" + std::to_string(house_.daemon().pid()) + "/environ");
  ASSERT_THAT(daemons, HasSubstr("SSH_AUTH_SOCK="));
  EXPECT_THAT(attackAsExtension({"variables"}), ElementsAre("HOME LANG PATH PWD TMPDIR"));
}

TEST_F(Leaks, NobodyConfinedHasACapabilityOrCanGainOne) {
  const std::vector<std::string> acts = {"status", "CapEff", "status", "CapPrm",     "status", "CapInh",
                                         "status", "CapAmb", "status", "NoNewPrivs", "status", "CapBnd"};
  const std::string none(16, '0');
  EXPECT_THAT(attack(acts), ElementsAre(none, none, none, none, "1", none));
  EXPECT_THAT(attackAsExtension(acts), ElementsAre(none, none, none, none, "1", none));
  EXPECT_THAT(unconfined({"status", "NoNewPrivs"}), ElementsAre("0")) << "it is the confinement that takes it away";
}

}  // namespace
}  // namespace docuvend::tests
