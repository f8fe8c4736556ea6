// Installers that are killed before the first change that they make on disk, the second, and so on until one comes through.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <set>

#include "platform/linux/bundles/BundleInstaller.h"
#include "tests/bundles/BundleHouse.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;

constexpr int kMostChanges = 1'000;

enum class End { killed, finished };

// The calls that change what is on disk, and when it gets there; between two of them there is nothing new to see.
bool changesSomething(const __ptrace_syscall_info& info) {
  switch (info.entry.nr) {
    case SYS_openat:
      return (info.entry.args[2] & O_CREAT) != 0;
    case SYS_write:
    case SYS_mkdirat:
    case SYS_symlinkat:
    case SYS_renameat2:
    case SYS_unlinkat:
    case SYS_fchmod:
    case SYS_fchmodat:
    case SYS_fsync:
#ifdef SYS_mkdir
    case SYS_mkdir:
    case SYS_chmod:
    case SYS_unlink:
    case SYS_rmdir:
#endif
      return true;
    default:
      return false;
  }
}

// Runs the work in a process that is killed when it is about to make its change number `changes`.
End runAndKill(int changes, const std::function<void()>& work) {
  const pid_t child = ::fork();
  if (child == 0) {
    ::ptrace(PTRACE_TRACEME, 0, nullptr, nullptr);
    ::raise(SIGSTOP);
    work();
    ::_exit(0);
  }
  int status = 0;
  EXPECT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_TRUE(WIFSTOPPED(status)) << status;
  EXPECT_EQ(::ptrace(PTRACE_SETOPTIONS, child, nullptr, PTRACE_O_EXITKILL | PTRACE_O_TRACESYSGOOD), 0);
  while (changes > 0) {
    ::ptrace(PTRACE_SYSCALL, child, nullptr, nullptr);
    ::waitpid(child, &status, 0);
    if (!WIFSTOPPED(status)) return End::finished;
    __ptrace_syscall_info info{};
    EXPECT_GT(::ptrace(PTRACE_GET_SYSCALL_INFO, child, sizeof(info), &info), 0);
    if (info.op == PTRACE_SYSCALL_INFO_ENTRY && changesSomething(info)) --changes;
  }
  ::kill(child, SIGKILL);
  ::waitpid(child, &status, 0);
  return End::killed;
}

class BundleInstallerInterrupted : public ::testing::Test {
 protected:
  void SetUp() override {
    prepare("new", "org.a");
    prepare("old", "org.a");
  }

  void prepare(const std::string& text, const std::string& identifier) const {
    BundleHouse::install(source(text), identifier);
    for (const char* name : {"/first", "/lib/last"}) BundleHouse::write(source(text) + name, text);
  }
  [[nodiscard]] std::string source(const std::string& text) const { return house_.root() + "/source-" + text; }
  void install(const std::string& text) {
    const auto result = installBundle(source(text), house_.paths, house_.propertyLists);
    if (const auto* error = std::get_if<QXError>(&result)) ADD_FAILURE() << error->description();
  }
  // What the registry sees: the text of the whole bundle, "none", or "half".
  std::string seen() {
    const auto bundles = house_.scan();
    const auto found = bundles.find("org.a");
    if (found == bundles.end()) return "none";
    std::string texts[2];
    std::ifstream(found->second.directory + "/first") >> texts[0];
    std::ifstream(found->second.directory + "/lib/last") >> texts[1];
    return texts[0] == texts[1] ? texts[0] : "half";
  }
  [[nodiscard]] int entries() const {
    return static_cast<int>(std::distance(fs::directory_iterator(house_.paths.userBundles), fs::directory_iterator()));
  }
  // Kills the work ever later. What is seen then is `before`, and from some call on `after`.
  void expectOnly(const std::string& before, const std::string& after, const std::function<void()>& prepareWork,
                  const std::function<void()>& work) {
    std::set<std::string> seenWhenKilled;
    for (int changes = 1; changes < kMostChanges; ++changes) {
      prepareWork();
      const End end = runAndKill(changes, work);
      const std::string state = seen();
      if (end == End::finished) {
        EXPECT_EQ(state, after);
        EXPECT_THAT(seenWhenKilled, ::testing::UnorderedElementsAre(before, after)) << "killed on both sides of the rename";
        return;
      }
      ASSERT_TRUE(state == before || state == after) << state << " when killed before change " << changes;
      ASSERT_FALSE(state == before && seenWhenKilled.contains(after)) << "back again when killed before change " << changes;
      seenWhenKilled.insert(state);
      install("new");
      ASSERT_EQ(entries(), 1) << "left over when killed before change " << changes;
    }
    ADD_FAILURE() << "never through";
  }

  BundleHouse house_;
};

TEST_F(BundleInstallerInterrupted, ANewBundleIsThereAsAWholeOrNotAtAll) {
  expectOnly(
      "none", "new", [this] { fs::remove_all(house_.paths.userBundles + "/org.a"); }, [this] { install("new"); });
}

TEST_F(BundleInstallerInterrupted, AnUpdateLeavesTheOldBundleOrTheNewOne) {
  expectOnly(
      "old", "new", [this] { install("old"); }, [this] { install("new"); });
}

TEST_F(BundleInstallerInterrupted, ARemovalLeavesTheBundleOrNone) {
  expectOnly(
      "new", "none", [this] { install("new"); }, [this] { (void)uninstallBundle("org.a", house_.paths, house_.propertyLists); });
}

TEST_F(BundleInstallerInterrupted, ARemovalOfSeveralCopiesNeverBringsAnotherToLight) {
  const auto copy = [this](const std::string& text, const std::string& name) {
    const std::string place = house_.paths.userBundles + "/" + name;
    fs::create_directories(house_.paths.userBundles);
    fs::copy(source(text), place, fs::copy_options::recursive);
  };
  expectOnly(
      "new", "none",
      [this, &copy] {
        fs::remove_all(house_.paths.userBundles);
        copy("old", "second");
        copy("new", "first");
        copy("old", "third");
      },
      [this] { (void)uninstallBundle("org.a", house_.paths, house_.propertyLists); });
}

}  // namespace
}  // namespace docuvend::linux_platform
