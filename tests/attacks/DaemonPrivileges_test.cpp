// What the daemon itself may do: as little as a process of its user can be held to, for an attacker who got into it.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <set>
#include <string>

#include "tests/attacks/AttackTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;

class DaemonPrivileges : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    house_.install(kCellar);
    house_.install(kEditor);
    house_.install(kPicker);
    // What this process is laxer in than the daemon is to be: it would pass all of it on.
    ::umask(0);
    for (const auto& entry : fs::directory_iterator("/proc/self/fd")) {
      const int number = std::stoi(entry.path().filename());
      if ((::fcntl(number, F_GETFD) & FD_CLOEXEC) == 0) inherited_.insert(number);
    }
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
    house_.startDaemon();
  }

  [[nodiscard]] std::string proc(const std::string& file) { return "/proc/" + std::to_string(house_.daemon().pid()) + "/" + file; }
  // A field of the daemon's status; of this process's for comparison.
  [[nodiscard]] static std::string field(const std::string& statusFile, const std::string& name) {
    for (const std::string& line : linesOf(contentsOf(statusFile))) {
      if (line.starts_with(name + ":\t")) return line.substr(name.size() + 2);
    }
    return "(absent)";
  }
  // What it is all for: it serves.
  void expectServes() const {
    const std::string string = house_.granted(letter_, kEditor);
    EXPECT_EQ(house_.confined(kEditor, {"show", string}).output, "Dear all\n");
  }

  std::set<int> inherited_;  // the daemon has them from this process
  std::string letter_;
};

TEST_F(DaemonPrivileges, ItHasNoCapabilityAndCanGainNoPrivilege) {
  const std::string none(16, '0');
  for (const char* set : {"CapInh", "CapPrm", "CapEff", "CapAmb"}) EXPECT_EQ(field(proc("status"), set), none) << set;
  EXPECT_EQ(field("/proc/self/status", "NoNewPrivs"), "0") << "it would have it from the test";
  EXPECT_EQ(field(proc("status"), "NoNewPrivs"), "1");
  expectServes();
}

TEST_F(DaemonPrivileges, ItStaysInTheUserNamespaceOfItsLaunchersByWhichItKnowsItsPeers) {
  EXPECT_EQ(fs::read_symlink(proc("ns/user")), fs::read_symlink("/proc/self/ns/user"));
  EXPECT_EQ(fs::read_symlink(proc("ns/mnt")), fs::read_symlink("/proc/self/ns/mnt"));
  expectServes();
}

TEST_F(DaemonPrivileges, WhatItMakesIsItsUsersAloneWhateverTheMaskItWasStartedWith) {
  EXPECT_EQ(field("/proc/self/status", "Umask"), "0000");
  EXPECT_EQ(field(proc("status"), "Umask"), "0077");
  expectServes();
  int seen = 0;
  for (const std::string& place : {house_.runtime() + "/docuvend", house_.home() + "/Library"}) {
    for (const auto& entry : fs::recursive_directory_iterator(place)) {
      struct stat status {};
      ASSERT_EQ(::lstat(entry.path().c_str(), &status), 0);
      EXPECT_EQ(status.st_mode & 077U, 0U) << entry.path();
      ++seen;
    }
  }
  EXPECT_GE(seen, 8);
}

TEST_F(DaemonPrivileges, NoDescriptorOfItsOwnIsLeftToAProgramThatItStarts) {
  expectServes();
  int seen = 0;
  for (const auto& entry : fs::directory_iterator(proc("fdinfo"))) {
    const int number = std::stoi(entry.path().filename());
    const std::string flags = field(entry.path(), "flags");
    if (inherited_.contains(number) || flags == "(absent)") continue;  // or it was closed meanwhile
    EXPECT_NE(std::stoul(flags, nullptr, 8) & O_CLOEXEC, 0U) << number;
    ++seen;
  }
  EXPECT_GE(seen, 8) << "it has sockets, a reactor and watches at least";
}

}  // namespace
}  // namespace docuvend::tests
