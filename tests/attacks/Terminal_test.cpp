// From inside a confinement at the terminal that an application was started at: to hear what is typed for others, and to upset it for them.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <memory>
#include <string>

#include "tests/attacks/AttackTest.h"
#include "tests/launch/ShellAtTerminal.h"

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;

class Terminal : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    installAttacker();
    std::filesystem::create_directories(house_.container(kAttacker));
    std::filesystem::permissions(house_.container(kAttacker), std::filesystem::perms::owner_all);
    shell_ = std::make_unique<ShellAtTerminal>(house_.environment());
    shell_->type("stty -echo; echo rea''dy\n");
    shell_->await("ready");
    usual_ = shell_->modes();
  }

  // Types this command, with what it prints in a file, and waits until it listens.
  void listen(const std::string& command, const std::string& name, const std::string& after, const std::string& before = "") {
    shell_->type(before + DOCUVEND_BIN + "/" + command + " upset-terminal overhear " + name + " >" + output() + after + "\n");
    eventually("it listens", [this] { return std::filesystem::exists(file("holding")); });
  }
  // Somebody reads a password at the shell.
  void typeToTheShell(const std::string& text) {
    shell_->type("read x; echo \"shell: $x\"\n" + text + "\n");
    shell_->await("shell: " + text);
  }
  void letItEnd() {
    writeFile(file("go"), "");
    eventually("it ends", [this] { return linesOf(contentsOf(output())).size() == 2; });
    EXPECT_THAT(linesOf(contentsOf(output())), ElementsAre("ok", "ok"));
  }
  [[nodiscard]] std::string file(const std::string& kind) const { return house_.container(kAttacker) + "/terminal." + kind; }
  [[nodiscard]] std::string output() const { return house_.home() + "/output"; }
  [[nodiscard]] std::string heard() const { return contentsOf(file("heard")); }

  std::unique_ptr<ShellAtTerminal> shell_;
  termios usual_{};
};

TEST_F(Terminal, InTheBackgroundAnApplicationHearsNothingAndUpsetsNothing) {
  listen("docuvend-run " + kAttacker, "terminal", " &");
  for (const char* password : {"one", "two", "three"}) typeToTheShell(password);
  EXPECT_TRUE(areEqual(shell_->modes(), usual_));
  letItEnd();
  EXPECT_EQ(heard(), "");
}

TEST_F(Terminal, StoppedAnApplicationHearsNothingMoreAndLeavesNothingUpset) {
  listen("docuvend-run " + kAttacker, "terminal", "");
  eventually("it is in front", [this] { return shell_->isRaw(); });
  shell_->type("for it\n");
  eventually("it hears what is meant for it", [this] { return heard() == "for it\n"; });

  shell_->type("\x1a");
  shell_->await("Stopped");
  for (const char* password : {"one", "two", "three"}) typeToTheShell(password);
  EXPECT_TRUE(areEqual(shell_->modes(), usual_));
  shell_->type("fg\n");
  letItEnd();
  EXPECT_EQ(heard(), "for it\n");
}

// What the same acts do with the user's terminal itself, from a session of their own.
TEST_F(Terminal, WithTheUsersTerminalTheSameActsSucceed) {
  const std::string name = house_.container(kAttacker) + "/terminal";
  listen("docuvend-attacker", name, "; echo d''one", "/usr/bin/setsid --wait ");
  EXPECT_FALSE(areEqual(shell_->modes(), usual_));
  shell_->type("password\n");
  eventually("it hears", [this] { return heard() == "password\n"; });
  letItEnd();
  shell_->await("done");
}

}  // namespace
}  // namespace docuvend::tests
