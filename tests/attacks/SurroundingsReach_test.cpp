// From inside a confinement at what lies around it: sockets, processes, the terminal.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstddef>
#include <filesystem>

#include "platform/linux/launch/policy/Landlock.h"
#include "platform/linux/wire/ConnectToSocket.h"
#include "tests/attacks/AttackTest.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::tests {
namespace {

using linux_platform::kLandlockScopesLevel;
using linux_platform::landlockLevel;
using ::testing::ElementsAre;

class Reach : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    installAttacker();
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
    house_.startDaemon();
  }

  // A socket that answers like any service of the user would.
  static UniqueDescriptor listenAt(const std::string& name, std::size_t offset = 0) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    name.copy(address.sun_path + offset, sizeof(address.sun_path) - 1 - offset);
    const auto size = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + name.size() + 1);
    UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    EXPECT_EQ(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), size), 0) << name;
    EXPECT_EQ(::listen(socket.get(), SOMAXCONN), 0) << name;
    return socket;
  }
  [[nodiscard]] static std::string abstractName() { return "docuvend-attacked-" + std::to_string(::getpid()); }
  // A kernel without scopes: the attacker has no network, and no abstract socket outside is there for it.
  [[nodiscard]] static std::string abstractOutcome() { return landlockLevel() >= kLandlockScopesLevel ? "EPERM" : "ECONNREFUSED"; }
};

TEST_F(Reach, TheUsersBusServiceManagerAndAdministrationAreNotThereForAnApplication) {
  const std::string bus = house_.runtime() + "/bus";
  std::filesystem::create_directory(house_.runtime() + "/systemd");
  const std::string manager = house_.runtime() + "/systemd/private";
  const auto busListener = listenAt(bus);
  const auto managerListener = listenAt(manager);
  const std::string administration = house_.administrationSocket();

  EXPECT_THAT(attack({"reach", bus, "reach", manager, "reach", administration, "reach", house_.publicSocket(kDVServiceName)}),
              ElementsAre("ENOENT", "ENOENT", "ENOENT", "ok"));
  EXPECT_THAT(unconfined({"reach", bus, "reach", manager, "reach", administration}), ElementsAre("ok", "ok", "ok"));
}

TEST_F(Reach, AnExtensionSeesNoSocketOfTheUserAtAll) {
  const std::string bus = house_.runtime() + "/bus";
  const auto busListener = listenAt(bus);
  const auto abstractListener = listenAt(abstractName(), /*offset=*/1);
  const std::vector<std::string> acts = {
      "reach", bus, "reach", house_.administrationSocket(), "reach", house_.publicSocket(kDVServiceName), "reach-abstract", abstractName()};
  // Without scopes an extension has the network, and abstract sockets with it; the documentation says so.
  const std::string abstract = landlockLevel() >= kLandlockScopesLevel ? "EPERM" : "ok";
  EXPECT_THAT(attackAsExtension(acts), ElementsAre("ENOENT", "ENOENT", "ENOENT", abstract));
  EXPECT_THAT(unconfined(acts), ElementsAre("ok", "ok", "ok", "ok"));
}

TEST_F(Reach, AbstractSocketsOutsideAreClosedAndItsOwnAreNot) {
  const auto listener = listenAt(abstractName(), /*offset=*/1);
  const std::vector<std::string> acts = {"reach-abstract", abstractName(), "own-abstract"};
  EXPECT_THAT(attack(acts), ElementsAre(abstractOutcome(), "ok"));
  EXPECT_THAT(unconfined(acts), ElementsAre("ok", "ok"));
}

TEST_F(Reach, TheDaemonCannotBeSignalledOrTracedAndAChildOfItsOwnCan) {
  const std::string daemon = std::to_string(house_.daemon().pid());
  std::vector<std::string> acts;
  for (const char* act : {"signal", "trace", "read-memory", "take-descriptor"}) acts.insert(acts.end(), {act, daemon, act, "child"});
  EXPECT_THAT(attack(acts), ElementsAre("ESRCH", "ok", "ESRCH", "ok", "ESRCH", "ok", "ESRCH", "ok"));
  EXPECT_THAT(attackAsExtension(acts), ElementsAre("ESRCH", "ok", "ESRCH", "ok", "ESRCH", "ok", "ESRCH", "ok"));
  EXPECT_TRUE(house_.answers());
}

// Process 1 is bubblewrap's, in the process namespace and outside the Landlock domain.
TEST_F(Reach, TheConfinementsOwnFirstProcessIsAsClosedAsTheDaemon) {
  const std::vector<std::string> acts = {"signal", "1", "trace", "1", "read-memory", "1", "take-descriptor", "1"};
  const std::string signalled = landlockLevel() >= kLandlockScopesLevel ? "EPERM" : "ok";
  EXPECT_THAT(attack(acts), ElementsAre(signalled, "EPERM", "EPERM", "EPERM"));
  EXPECT_THAT(attackAsExtension(acts), ElementsAre(signalled, "EPERM", "EPERM", "EPERM"));
  EXPECT_THAT(attack({"open-device", "/proc/1/root", "open-device", "/proc/1/mem", "open-device", "/proc/1/environ", "open-device",
                      "/proc/self/oom_score_adj"}),
              ElementsAre("EACCES", "EACCES", "EACCES", "EACCES"));
}

TEST_F(Reach, KillingEverybodyKillsNobodyElse) {
  const std::string letter = house_.granted(house_.putInCloud("letter.txt", "Dear all\n"), kEditor);
  const auto extensions = house_.processesOf("cellar");
  ASSERT_EQ(extensions.size(), 1U);

  EXPECT_THAT(attack({"signal-all"}), ElementsAre("ESRCH"));
  EXPECT_THAT(attackAsExtension({"signal-all"}), ElementsAre("ESRCH"));
  EXPECT_EQ(house_.processesOf("cellar"), extensions);
  EXPECT_TRUE(house_.daemon().isRunning());
  EXPECT_EQ(house_.confined(kEditor, {"show", letter}).output, "Dear all\n");
}

// The application is started at a terminal, as from a shell whose session the terminal controls.
class AtATerminal : public Reach {
 protected:
  void SetUp() override {
    Reach::SetUp();
    terminal_ = UniqueDescriptor(::posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC | O_NONBLOCK));
    ASSERT_TRUE(terminal_);
    ASSERT_EQ(::grantpt(terminal_.get()), 0);
    ASSERT_EQ(::unlockpt(terminal_.get()), 0);
    const char* name = ::ptsname(terminal_.get());
    ASSERT_NE(name, nullptr);
    name_ = name;
    shell_ = UniqueDescriptor(::open(name, O_RDWR | O_NOCTTY | O_CLOEXEC));
    ASSERT_TRUE(shell_);
  }

  // The words of a program, run by a session's leader whose terminal this is; what it prints, line by line.
  [[nodiscard]] std::vector<std::string> runThere(const std::vector<std::string>& program, const std::vector<std::string>& acts) const {
    // A leader without a terminal gets the one that it opens.
    Command command{{"/usr/bin/setsid", "--wait", "/bin/sh", "-c", "terminal=$1; shift; exec \"$@\" <>\"$terminal\"", "sh", name_},
                    house_.environment(),
                    {}};
    command.words.insert(command.words.end(), program.begin(), program.end());
    command.words.insert(command.words.end(), acts.begin(), acts.end());
    Process process(command);
    const Ending& ending = process.wait();
    EXPECT_EQ(ending.status, 0) << ending.errors;
    return linesOf(ending.output);
  }
  // What somebody who reads at the terminal would find typed there.
  [[nodiscard]] int waitingInput() const {
    int count = 0;
    EXPECT_EQ(::ioctl(shell_.get(), FIONREAD, &count), 0);
    return count;
  }

  UniqueDescriptor terminal_;
  UniqueDescriptor shell_;
  std::string name_;
};

TEST_F(AtATerminal, AnApplicationTypesNothingIntoItAndDoesNotTakeIt) {
  EXPECT_THAT(runThere({std::string(DOCUVEND_BIN) + "/docuvend-run", kAttacker},
                       {"type", "rm -rf ~\n", "take-terminal", "open-device", "/dev/tty", "terminal"}),
              ElementsAre("EPERM", "ok", "EACCES", "none"))
      << "the one that it takes is its own";
  EXPECT_EQ(waitingInput(), 0);

  // The same words of a process of the terminal's own session; a kernel may have this closed for everybody.
  const auto honest =
      runThere({std::string(DOCUVEND_BIN) + "/docuvend-attacker"}, {"type", "hello\n", "open-device", "/dev/tty", "terminal"});
  const bool isClosedForAll = contentsOf("/proc/sys/dev/tty/legacy_tiocsti") == "0\n";
  EXPECT_THAT(honest, ElementsAre(isClosedForAll ? "EIO" : "ok", "ok", "there"));
  EXPECT_EQ(waitingInput(), isClosedForAll ? 0 : 6);
}

}  // namespace
}  // namespace docuvend::tests
