// docuvend-run at a terminal, as a job of a shell.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <iterator>
#include <memory>

#include "platform/linux/base/pidfd.h"
#include "tests/launch/ConfinedHouse.h"
#include "tests/launch/ShellAtTerminal.h"

namespace docuvend::linux_platform {
namespace {

using tests::areEqual;
using tests::eventually;
using tests::ShellAtTerminal;

class OwnTerminal : public ConfinedTest {
 protected:
  void SetUp() override {
    ConfinedTest::SetUp();
    (void)house_.installProbe("org.a");
    shell_ = std::make_unique<ShellAtTerminal>(std::vector<std::string>{"PATH=/usr/bin:/bin:" DOCUVEND_BIN, "HOME=" + house_.paths.home,
                                                                        "XDG_RUNTIME_DIR=" + house_.root() + "/run"});
    // The shell is there, and shows only what programs write.
    shell_->type("stty -echo; echo rea''dy\n");
    shell_->await("ready");
    usual_ = shell_->modes();
  }

  // Types a command, whose application says first that it runs.
  void start(const std::string& acts, const std::string& after = "") {
    shell_->type("docuvend-run org.a variable HOME " + acts + after + "\n");
    shell_->await("variable HOME: ");
  }
  void startInFront(const std::string& acts, const std::string& after = "") {
    start(acts, after);
    eventually("what is typed goes to the application", [this] { return shell_->isRaw(); });
  }
  void expectUsualModes() const { EXPECT_TRUE(areEqual(shell_->modes(), usual_)); }
  // The shell's own reader of the terminal gets this.
  void expectTheShellReads(const std::string& text) {
    shell_->type("read x; echo \"shell: $x\"\n" + text + "\n");
    shell_->await("shell: " + text);
  }
  void expectItEnds(const UniqueDescriptor& process) {
    pollfd waiting{process.get(), POLLIN, 0};
    EXPECT_EQ(::poll(&waiting, 1, static_cast<int>(std::chrono::milliseconds(tests::kPatience).count())), 1) << "it goes on";
  }
  std::string contents(const std::string& name) const {
    std::ifstream file(house_.root() + "/" + name);
    return {std::istreambuf_iterator<char>(file), {}};
  }

  std::unique_ptr<ShellAtTerminal> shell_;
  termios usual_{};
};

TEST_F(OwnTerminal, InFrontTheApplicationIsReadAndTypedTo) {
  startInFront("line 0 line 0 exit 5", "; echo status $?");
  shell_->type("hello\n");
  shell_->await("line 0: hello\r\n");
  shell_->type("wolr\x7f\x7frld\n");
  shell_->await("line 0: world\r\n");
  shell_->await("status 5\r\n");
}

TEST_F(OwnTerminal, InTheBackgroundNothingTypedReachesTheApplication) {
  start("line 0", " &");
  expectTheShellReads("secret");
  expectTheShellReads("word");
  shell_->type("fg\n");
  eventually("it is in front", [this] { return shell_->isRaw(); });
  shell_->type("hello\n");
  shell_->await("line 0: hello");
}

TEST_F(OwnTerminal, InTheBackgroundItGoesOnWriting) {
  start("flood 1000 exit 3", " & wait $!; echo status $?");
  shell_->await("line 1000");
  shell_->await("status 3");
}

TEST_F(OwnTerminal, StoppedNothingTypedReachesTheApplication) {
  startInFront("line 0");
  shell_->type("\x1a");
  shell_->await("Stopped");
  expectUsualModes();
  expectTheShellReads("secret");
  shell_->type("fg\n");
  eventually("it is in front again", [this] { return shell_->isRaw(); });
  shell_->type("hello\n");
  shell_->await("line 0: hello");
}

TEST_F(OwnTerminal, WhatTheApplicationSetsIsSetAtItsOwn) {
  startInFront("settings raw line 0");
  shell_->await("settings raw: ok");
  EXPECT_NE(shell_->modes().c_lflag & ISIG, 0U) << "the user's signals are the user's";
  shell_->type("\x1a");
  shell_->await("Stopped");
  expectUsualModes();
}

TEST_F(OwnTerminal, PutsTheUsersModesBackAtTheEnd) {
  startInFront("line 0", "; echo status $?");
  shell_->type("\n");
  shell_->await("status 0");
  expectUsualModes();
}

TEST_F(OwnTerminal, IsInterruptedWhateverTheApplicationSets) {
  startInFront("settings raw line 0", "; echo status $?");
  shell_->await("settings raw: ok");
  shell_->type("\x03");
  eventually("the shell is in front again", [this] { return !shell_->isRaw(); });
  shell_->type("echo status $?\n");
  shell_->await("status 130");
  expectUsualModes();
}

TEST_F(OwnTerminal, TerminatedItEndsTheApplicationAndPutsTheUsersModesBack) {
  const std::string place = house_.root() + "/number";
  shell_->type("sh -c 'echo $$ >" + place + "; exec docuvend-run org.a variable HOME line 0'; echo status $?\n");
  eventually("it is in front", [this] { return shell_->isRaw(); });
  shell_->await("variable HOME: ");
  ASSERT_EQ(::kill(std::stoi(contents("number")), SIGTERM), 0);
  shell_->await("status 143");
  expectUsualModes();
}

TEST_F(OwnTerminal, EndsWithTheSignalThatEndedTheApplication) {
  start("die 15", "; echo status $?");
  shell_->await("status 143");
}

TEST_F(OwnTerminal, EndsWithTheProcessThatStartedIt) {
  start("line 0", " &");
  shell_->type("echo $! >" + house_.root() + "/number; echo d''one\n");
  shell_->await("done");
  const auto process = openPidfd(std::stoi(contents("number")));
  ASSERT_TRUE(process);
  shell_->end();
  expectItEnds(process);
}

TEST_F(OwnTerminal, TerminatedItDoesNotWaitForATerminalThatIsHeldUp) {
  shell_->type("sh -c 'echo $$ >" + house_.root() + "/number; exec docuvend-run org.a flood 100000000'; echo status $?\n");
  shell_->await("line 1000\r");
  const auto process = openPidfd(std::stoi(contents("number")));
  ASSERT_TRUE(process);
  shell_->flow(TCOOFF);
  signalPidfd(process, SIGTERM);
  expectItEnds(process);
  shell_->flow(TCOON);
  shell_->await("status 143");
}

TEST_F(OwnTerminal, ItsSizeFollowsTheUsers) {
  startInFront("await-size 24x80 await-size 30x100");
  shell_->await("await-size 24x80: ok");
  shell_->resize(30, 100);
  shell_->await("await-size 30x100: ok");
}

TEST_F(OwnTerminal, NothingThatTheApplicationWroteIsLostAtItsEnd) {
  start("flood 30000", "; echo status $?");
  const std::string shown = shell_->textUntil("status 0");
  EXPECT_EQ(std::count(shown.begin(), shown.end(), '\n'), 30002);
  EXPECT_THAT(shown, ::testing::HasSubstr("\nline 30000\r\nflood 30000: ok\r\n"));
}

TEST_F(OwnTerminal, WhatIsNoTerminalIsPassedAsItIs) {
  shell_->type("echo piped | docuvend-run org.a line 0 size 0 size 1 size 2 2>/dev/null >" + house_.root() + "/out; echo d''one\n");
  shell_->await("done");
  EXPECT_EQ(contents("out"), "line 0: piped\nsize 0: ENOTTY\nsize 1: ENOTTY\nsize 2: ENOTTY\n");

  shell_->type("docuvend-run org.a size 0 size 1 size 2 line 0 >" + house_.root() + "/out; echo d''one\n");
  eventually("it is in front", [this] { return shell_->isRaw(); });
  EXPECT_EQ(shell_->modes().c_oflag, usual_.c_oflag) << "another program of a pipeline may write there";
  shell_->type("typed\n");
  shell_->await("done");
  EXPECT_EQ(contents("out"), "size 0: 24x80\nsize 1: ENOTTY\nsize 2: 24x80\nline 0: typed\n");

  shell_->type("echo piped | docuvend-run org.a line 0 size 0 size 1\n");
  shell_->await("line 0: piped\r\nsize 0: ENOTTY\r\nsize 1: 24x80\r\n");
}

TEST_F(OwnTerminal, WhyNothingIsStartedIsShown) {
  std::filesystem::remove_all(house_.paths.userBundles + "/org.a");
  shell_->type("docuvend-run org.a; echo status $?\n");
  shell_->await("docuvend-run: no bundle org.a is installed\r\nstatus 127");
  expectUsualModes();
}

}  // namespace
}  // namespace docuvend::linux_platform
