#include "platform/linux/launch/LaunchArguments.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>

namespace docuvend::linux_platform {
namespace {

using ::testing::Contains;
using ::testing::Not;
using Words = std::vector<std::string>;

constexpr int kNewLevel = 7;
constexpr int kOldLevel = 5;

class LaunchArguments : public ::testing::Test {
 protected:
  LaunchArguments() {
    host_.systemLinks = {{"/bin", "usr/bin"}};
    host_.systemDirectories = {"/usr"};
    host_.systemFiles = {"/etc/passwd"};
    host_.networkFiles = {"/etc/resolv.conf"};
    host_.landlockLevel = kNewLevel;
    host_.bubblewrap = "/usr/bin/bwrap";
    host_.helper = "/usr/libexec/docuvend/docuvend-confine";
    subject_.bundleDirectory = "/b";
    subject_.executable = "/b/program";
    subject_.arguments = {"one", "--two"};
    subject_.container = "/c";
    subject_.groups = {"/g1", "/g2"};
    subject_.publicSockets = "/run/docuvend/public";
    subject_.descriptionDescriptor = 4;
  }

  [[nodiscard]] Words all() const { return launchArguments(subject_, host_); }
  // What bubblewrap itself is told.
  [[nodiscard]] Words outer() const {
    const auto words = all();
    return {words.begin(), std::find(words.begin(), words.end(), "--")};
  }
  [[nodiscard]] static bool has(const Words& words, const Words& part) {
    return std::search(words.begin(), words.end(), part.begin(), part.end()) != words.end();
  }
  [[nodiscard]] static std::ptrdiff_t place(const Words& words, const Words& part) {
    return std::search(words.begin(), words.end(), part.begin(), part.end()) - words.begin();
  }
  [[nodiscard]] std::vector<std::string> allowed(PathAccess access) const {
    std::vector<std::string> paths;
    for (const auto& rule : confinePolicy(subject_, host_).rules) {
      if (rule.access == access) paths.push_back(rule.path);
    }
    return paths;
  }

  HostLayout host_;
  LaunchSubject subject_;
};

TEST_F(LaunchArguments, AskForEveryNamespaceButTheNetworksAndForNoFurtherOnes) {
  const auto words = outer();
  EXPECT_EQ(words[0], "/usr/bin/bwrap");
  for (const char* word : {"--unshare-user", "--unshare-pid", "--unshare-ipc", "--unshare-uts", "--unshare-cgroup-try", "--disable-userns",
                           "--new-session", "--die-with-parent"}) {
    EXPECT_THAT(words, Contains(word));
  }
  EXPECT_TRUE(has(words, {"--cap-drop", "ALL"}));
  EXPECT_THAT(words, Not(Contains("--unshare-net")));
  EXPECT_THAT(words, Not(Contains("--share-net")));
}

TEST_F(LaunchArguments, TakeTheNetworkFromAnApplicationWhereLandlockLeavesAbstractSocketsOpen) {
  host_.landlockLevel = kOldLevel;
  EXPECT_THAT(outer(), Contains("--unshare-net"));
  EXPECT_FALSE(has(outer(), {"--ro-bind", "/etc/resolv.conf", "/etc/resolv.conf"}));
  EXPECT_THAT(allowed(PathAccess::read), Not(Contains("/etc/resolv.conf")));
  subject_.kind = LaunchKind::extension;
  EXPECT_THAT(outer(), Not(Contains("--unshare-net")));
}

TEST_F(LaunchArguments, ShowWhatBelongsToTheBundleAndTheSystem) {
  const auto words = outer();
  EXPECT_TRUE(has(words, {"--ro-bind", "/usr", "/usr"}));
  EXPECT_TRUE(has(words, {"--symlink", "usr/bin", "/bin"}));
  EXPECT_TRUE(has(words, {"--ro-bind", "/etc/passwd", "/etc/passwd"}));
  EXPECT_TRUE(has(words, {"--ro-bind", "/b", "/b"}));
  EXPECT_TRUE(has(words, {"--bind", "/c", "/c"}));
  EXPECT_TRUE(has(words, {"--bind", "/g1", "/g1"}));
  EXPECT_TRUE(has(words, {"--bind", "/g2", "/g2"}));
  EXPECT_TRUE(has(words, {"--ro-bind", "/run/docuvend/public", "/run/docuvend/public"}));
  EXPECT_TRUE(has(words, {"--ro-bind-data", "4", "/.docuvend-info"}));
  EXPECT_TRUE(has(words, {"--chdir", "/c"}));
  EXPECT_EQ(std::count(words.begin(), words.end(), "--bind"), 3);
}

TEST_F(LaunchArguments, MountTheDirectoriesOverTemporaryFilesAndCloseTheRootLast) {
  const auto words = outer();
  const auto temporary = place(words, {"--tmpfs", "/tmp"});
  const auto close = place(words, {"--remount-ro", "/"});
  for (const Words& mount :
       {Words{"--ro-bind", "/b", "/b"}, Words{"--bind", "/c", "/c"}, Words{"--bind", "/g2", "/g2"},
        Words{"--ro-bind", "/run/docuvend/public", "/run/docuvend/public"}, Words{"--ro-bind-data", "4", "/.docuvend-info"}}) {
    EXPECT_LT(temporary, place(words, mount));
    EXPECT_LT(place(words, mount), close);
  }
  EXPECT_LT(close, static_cast<std::ptrdiff_t>(words.size()));
}

TEST_F(LaunchArguments, GiveTheExecutableItsArgumentsThroughTheHelper) {
  const auto words = all();
  EXPECT_TRUE(has(words, {"--", "/.docuvend-confine"}));
  ASSERT_GE(words.size(), 4U);
  EXPECT_EQ(Words(words.end() - 4, words.end()), (Words{"--", "/b/program", "one", "--two"}));
}

TEST_F(LaunchArguments, LetLandlockAllowNoMoreThanTheMountsShow) {
  EXPECT_EQ(allowed(PathAccess::readExecute), (Words{"/usr", "/b"}));
  EXPECT_EQ(allowed(PathAccess::readWrite), (Words{"/dev/shm", "/tmp", "/c", "/g1", "/g2"}));
  EXPECT_EQ(allowed(PathAccess::read), (Words{"/etc/passwd", "/etc/resolv.conf", "/proc", "/.docuvend-info", "/run/docuvend/public"}));
  EXPECT_EQ(allowed(PathAccess::device), (Words{"/dev/full", "/dev/null", "/dev/random", "/dev/urandom", "/dev/zero"}));
}

TEST_F(LaunchArguments, ShowAnExtensionNoSockets) {
  subject_.kind = LaunchKind::extension;
  EXPECT_THAT(all(), Not(Contains("/run/docuvend/public")));
}

// What a provider needs to take the contents from a file that nobody has open.
TEST_F(LaunchArguments, LeaveLeasesToExtensionsAlone) {
  EXPECT_EQ(confinePolicy(subject_, host_).leases, Leases::refused);
  subject_.kind = LaunchKind::extension;
  EXPECT_EQ(confinePolicy(subject_, host_).leases, Leases::taken);
}

TEST_F(LaunchArguments, LimitAnExtensionAndAnApplication) {
  const auto application = confinePolicy(subject_, host_);
  EXPECT_EQ(application.descriptors, 3);
  EXPECT_EQ(application.processes, kApplicationProcesses);
  EXPECT_FALSE(application.memory);
  EXPECT_EQ(application.openFiles, kApplicationOpenFiles);
  EXPECT_EQ(application.pendingSignals, kConfinedPendingSignals);
  EXPECT_EQ(application.lockedMemory, kConfinedLockedMemory);

  subject_.kind = LaunchKind::extension;
  const auto extension = confinePolicy(subject_, host_);
  EXPECT_EQ(extension.descriptors, 4);
  EXPECT_EQ(extension.processes, kExtensionProcesses);
  EXPECT_EQ(extension.memory, kExtensionMemory);
  EXPECT_EQ(extension.openFiles, kExtensionOpenFiles);
  EXPECT_EQ(extension.pendingSignals, kConfinedPendingSignals);
  EXPECT_EQ(extension.lockedMemory, kConfinedLockedMemory);

  host_.landlockLevel = kProcessLimitLevel - 1;
  for (const LaunchKind kind : {LaunchKind::application, LaunchKind::extension}) {
    subject_.kind = kind;
    EXPECT_FALSE(confinePolicy(subject_, host_).processes);
    EXPECT_TRUE(confinePolicy(subject_, host_).openFiles);
  }
}

// The kernel counts them for the user, wherever his processes are.
TEST_F(LaunchArguments, GiveNoLaunchMoreThanHalfOfThePendingSignalsThatItsUserMayHave) {
  for (const LaunchKind kind : {LaunchKind::application, LaunchKind::extension}) {
    subject_.kind = kind;
    host_.pendingSignals = kConfinedPendingSignals * 2 + 2;
    EXPECT_EQ(confinePolicy(subject_, host_).pendingSignals, kConfinedPendingSignals);
    host_.pendingSignals = 3801;
    EXPECT_EQ(confinePolicy(subject_, host_).pendingSignals, 1900);
    host_.pendingSignals = 1;
    EXPECT_EQ(confinePolicy(subject_, host_).pendingSignals, 1);
    host_.pendingSignals = std::nullopt;
    EXPECT_EQ(confinePolicy(subject_, host_).pendingSignals, kConfinedPendingSignals);
  }
}

// What is shared and locked is counted for the user, wherever his processes are.
TEST_F(LaunchArguments, GiveNoLaunchMoreThanHalfOfTheMemoryThatItsUserMayLock) {
  for (const LaunchKind kind : {LaunchKind::application, LaunchKind::extension}) {
    subject_.kind = kind;
    host_.lockedMemory = kConfinedLockedMemory * 2 + 2;
    EXPECT_EQ(confinePolicy(subject_, host_).lockedMemory, kConfinedLockedMemory);
    host_.lockedMemory = 65536;
    EXPECT_EQ(confinePolicy(subject_, host_).lockedMemory, 32768);
    host_.lockedMemory = 1;
    EXPECT_EQ(confinePolicy(subject_, host_).lockedMemory, 1);
    host_.lockedMemory = std::nullopt;
    EXPECT_EQ(confinePolicy(subject_, host_).lockedMemory, kConfinedLockedMemory);
  }
}

TEST_F(LaunchArguments, GiveAnApplicationNoMoreThanHalfOfWhatItsUserMayHave) {
  host_.processes = kApplicationProcesses * 2 + 2;
  host_.openFiles = kApplicationOpenFiles * 2 + 2;
  EXPECT_EQ(confinePolicy(subject_, host_).processes, kApplicationProcesses);
  EXPECT_EQ(confinePolicy(subject_, host_).openFiles, kApplicationOpenFiles);
  host_.processes = 301;
  host_.openFiles = 1024;
  EXPECT_EQ(confinePolicy(subject_, host_).processes, 150);
  EXPECT_EQ(confinePolicy(subject_, host_).openFiles, 512);
  host_.processes = 1;  // a limit of nothing is none that can be asked for
  host_.openFiles = 1;
  EXPECT_EQ(confinePolicy(subject_, host_).processes, 1);
  EXPECT_EQ(confinePolicy(subject_, host_).openFiles, 1);
}

}  // namespace
}  // namespace docuvend::linux_platform
