#include "platform/linux/launch/ConfinedLaunch.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <linux/keyctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstdlib>

#include "platform/linux/launch/LaunchArguments.h"
#include "platform/linux/launch/LaunchDescription.h"
#include "tests/launch/ConfinedHouse.h"
#include "tests/support/KeyQuota.h"

namespace docuvend::linux_platform {
namespace {

using ::testing::AnyOf;
using ::testing::HasSubstr;
using ::testing::Not;

std::string groups(const std::vector<std::string>& names) { return BundleHouse::entry("QXGroups", BundleHouse::array(names)); }

struct SocketPair {
  UniqueDescriptor ours;
  UniqueDescriptor theirs;
};

SocketPair makeSocketPair() {
  std::array<int, 2> ends{};
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) throw std::runtime_error("no socket pair");
  return {UniqueDescriptor(ends[0]), UniqueDescriptor(ends[1])};
}

UniqueDescriptor listenAt(const std::string& name, std::size_t offset) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  name.copy(address.sun_path + offset, sizeof(address.sun_path) - offset - 1);
  const auto size = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + name.size() + 1);
  UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), size) != 0 || ::listen(socket.get(), 1) != 0) {
    throw std::runtime_error("cannot listen at " + name);
  }
  return socket;
}

std::string errorOf(std::variant<LaunchPlan, QXError> result) {
  const auto* error = std::get_if<QXError>(&result);
  return error != nullptr ? error->description() : "";
}

class ConfinedApplication : public ConfinedTest {
 protected:
  // What the application's one attempt came to.
  [[nodiscard]] std::string attempt(const Bundle& bundle, const std::string& what, const std::string& subject) {
    const auto outcomes = house_.run(bundle, {what, subject});
    const auto found = outcomes.find(what + " " + subject);
    return found == outcomes.end() ? "never said; status " + outcomes.at("status") : found->second;
  }
};

TEST_F(ConfinedApplication, RunsInItsContainerWithAClearedEnvironment) {
  ::setenv("SECRET", "x", 1);
  ::setenv("LD_PRELOAD_NOT", "x", 1);
  ::setenv("TERM", "dumb", 1);
  ::setenv("LANG", "de_DE.UTF-8", 1);
  const auto bundle = house_.installProbe("org.a");
  const auto outcomes = house_.run(bundle, {"variables", "all", "variable", "HOME", "variable", "TMPDIR", "variable", "XDG_RUNTIME_DIR",
                                            "variable", "TERM", "variable", "LANG", "where", "am-i"});
  EXPECT_EQ(outcomes.at("variables all"), "HOME LANG PATH PWD TERM TMPDIR XDG_RUNTIME_DIR");
  EXPECT_EQ(outcomes.at("variable HOME"), bundle.container);
  EXPECT_EQ(outcomes.at("variable TMPDIR"), "/tmp");
  EXPECT_EQ(outcomes.at("variable XDG_RUNTIME_DIR"), house_.root() + "/run");
  EXPECT_EQ(outcomes.at("variable TERM"), "dumb");
  EXPECT_EQ(outcomes.at("variable LANG"), "de_DE.UTF-8");
  EXPECT_EQ(outcomes.at("where am-i"), bundle.container);
}

TEST_F(ConfinedApplication, GetsNoStrangeWordsFromTheLaunchersEnvironment) {
  ::setenv("LANG", "../../etc", 1);
  ::setenv("TERM", std::string(65, 'x').c_str(), 1);
  const auto outcomes = house_.run(house_.installProbe("org.a"), {"variable", "LANG", "variable", "TERM"});
  EXPECT_EQ(outcomes.at("variable LANG"), "C.UTF-8");
  EXPECT_EQ(outcomes.at("variable TERM"), "(absent)");
}

TEST_F(ConfinedApplication, GetsItsArgumentsAndGivesItsStatus) {
  const auto bundle = house_.installProbe("org.a");
  EXPECT_EQ(house_.run(bundle, {"exit", "42"}).at("status"), "42");
  EXPECT_EQ(house_.run(bundle, {"where", "--"}).at("where --"), bundle.container);
}

TEST_F(ConfinedApplication, OwnsItsContainerAndTemporaryFiles) {
  const auto bundle = house_.installProbe("org.a");
  const std::string file = bundle.container + "/file";
  const auto outcomes = house_.run(
      bundle, {"create", file, "write", file, "truncate", file, "chmod", file, "read", file, "create", "/tmp/x", "unlink", "/tmp/x"});
  for (const char* what : {"create", "write", "truncate", "chmod", "read"}) EXPECT_EQ(outcomes.at(what + (" " + file)), "ok");
  EXPECT_EQ(outcomes.at("create /tmp/x"), "ok");
  EXPECT_EQ(outcomes.at("unlink /tmp/x"), "ok");
  EXPECT_TRUE(std::filesystem::exists(file));
  struct stat status {};
  ASSERT_EQ(::stat(bundle.container.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0700U);
}

TEST_F(ConfinedApplication, ExecutesWhatIsInstalledAndNotWhatItWrote) {
  const auto bundle = house_.installProbe("org.a");
  const std::string written = bundle.container + "/true";
  std::filesystem::create_directories(bundle.container);
  std::filesystem::copy_file("/usr/bin/true", written);
  const auto outcomes = house_.run(bundle, {"execute", "/usr/bin/true", "execute", written});
  EXPECT_EQ(outcomes.at("execute /usr/bin/true"), "ok");
  EXPECT_EQ(outcomes.at("execute " + written), "EACCES");
}

TEST_F(ConfinedApplication, SeesNothingElseOfTheHome) {
  const auto other = house_.installProbe("org.other", groups({"org.other.docs"}));
  const auto bundle = house_.installProbe("org.a");
  BundleHouse::write(house_.paths.home + "/secret", "x");
  BundleHouse::write(other.container + "/secret", "x");
  BundleHouse::write(other.groups.at("org.other.docs") + "/secret", "x");
  BundleHouse::write(house_.paths.runtime + "/token-key", "x");
  ::chmod(house_.paths.runtime.c_str(), 0700);
  for (const std::string& path : {house_.paths.home + "/secret", other.container, other.container + "/secret", other.directory,
                                  other.groups.at("org.other.docs") + "/secret", house_.paths.runtime + "/token-key"}) {
    EXPECT_TRUE(std::filesystem::exists(path)) << path;
    const auto outcomes = house_.run(bundle, {"read", path, "stat", path});
    EXPECT_EQ(outcomes.at("read " + path), "ENOENT");
    EXPECT_EQ(outcomes.at("stat " + path), "ENOENT");
  }
  EXPECT_EQ(attempt(bundle, "entries", house_.paths.home), ".local");
  EXPECT_EQ(attempt(bundle, "entries", house_.paths.containers), "org.a");
  EXPECT_EQ(attempt(bundle, "list", "/root"), "ENOENT");
  EXPECT_EQ(attempt(bundle, "read", "/etc/shadow"), "ENOENT");
}

TEST_F(ConfinedApplication, ChangesNeitherItsBundleNorTheSystemNorItsDescription) {
  const auto bundle = house_.installProbe("org.a");
  for (const std::string& path : {bundle.directory + "/Info.plist", bundle.executable, std::string("/usr/bin/env"),
                                  std::string("/.docuvend-info"), std::string("/.docuvend-confine"), house_.paths.publicSockets}) {
    const auto outcomes = house_.run(bundle, {"write", path, "truncate", path, "chmod", path, "unlink", path});
    ASSERT_EQ(outcomes.count("unlink " + path), 1U) << path;
    for (const char* what : {"write", "truncate", "chmod", "unlink"}) {
      EXPECT_THAT(outcomes.at(what + (" " + path)), AnyOf("EACCES", "EROFS", "EPERM", "EISDIR", "EBUSY", "ETXTBSY")) << what << " " << path;
    }
  }
  const std::string beside = bundle.directory + "/new";
  EXPECT_THAT(attempt(bundle, "create", beside), AnyOf("EACCES", "EROFS"));
  EXPECT_FALSE(std::filesystem::exists(beside));
  EXPECT_THAT(attempt(bundle, "create", "/new"), AnyOf("EACCES", "EROFS"));
  EXPECT_THAT(attempt(bundle, "create", house_.paths.publicSockets + "/com.orvane.Docuvend"), AnyOf("EACCES", "EROFS"));
}

TEST_F(ConfinedApplication, ReadsItsDescription) {
  const auto bundle = house_.installProbe("org.a");
  auto plan = house_.plan(bundle, {"read", "/.docuvend-info"});
  std::array<char, kLongestDescription> text{};
  const ssize_t count = ::pread(plan.inherited.back().descriptor.get(), text.data(), text.size(), 0);
  ASSERT_GT(count, 0);
  const auto description = parseDescription({text.data(), static_cast<std::size_t>(count)});
  ASSERT_TRUE(description);
  EXPECT_EQ(description->bundleIdentifier, "org.a");
  EXPECT_EQ(description->incarnation, bundle.incarnation);
  EXPECT_EQ(description->kind, LaunchKind::application);
  EXPECT_EQ(ConfinedHouse::outcomes(ConfinedHouse::start(std::move(plan))).at("read /.docuvend-info"), "ok");
}

TEST_F(ConfinedApplication, MakesNoNamespacesAndMountsNothing) {
  const auto bundle = house_.installProbe("org.a");
  EXPECT_THAT(attempt(bundle, "unshare", "user"), AnyOf("EPERM", "ENOSPC", "EUSERS"));
  EXPECT_EQ(attempt(bundle, "unshare", "mount"), "EPERM");
  EXPECT_EQ(attempt(bundle, "mount", "/usr/bin/env"), "EPERM");
  EXPECT_EQ(attempt(bundle, "chroot", "/tmp"), "EPERM");
}

TEST_F(ConfinedApplication, SeesItsOwnProcessesAlone) {
  const auto bundle = house_.installProbe("org.a");
  EXPECT_EQ(attempt(bundle, "numbers", "/proc"), "1 2");
  EXPECT_EQ(attempt(bundle, "kill", std::to_string(::getpid())), "ESRCH");
}

// Process 1 is bubblewrap's own: inside the namespace, outside the Landlock domain.
TEST_F(ConfinedApplication, SendsNoSignalOutOfItsDomain) { EXPECT_EQ(attempt(house_.installProbe("org.a"), "kill", "1"), "EPERM"); }

TEST_F(ConfinedApplication, LooksIntoNoProcessOutOfItsDomain) {
  const auto bundle = house_.installProbe("org.a");
  EXPECT_EQ(attempt(bundle, "list", "/proc/1/root"), "EACCES");
  EXPECT_EQ(attempt(bundle, "read", "/proc/1/environ"), "EACCES");
}

TEST_F(ConfinedApplication, ReachesNoAbstractSocketOutside) {
  const std::string name = "docuvend-test-" + std::to_string(::getpid());
  const auto listener = listenAt(name, /*offset=*/1);
  EXPECT_EQ(attempt(house_.installProbe("org.a"), "abstract", name), "EPERM");
}

TEST_F(ConfinedApplication, ReachesPublicSocketsAndNoOthers) {
  const auto bundle = house_.installProbe("org.a");
  ASSERT_FALSE(prepareRuntimeDirectories(house_.paths));
  const std::string publicName = house_.paths.publicSockets + "/s";
  const std::string privateName = house_.paths.runtime + "/s";
  const auto publicListener = listenAt(publicName, /*offset=*/0);
  const auto privateListener = listenAt(privateName, /*offset=*/0);
  EXPECT_EQ(attempt(bundle, "connect", publicName), "ok");
  EXPECT_EQ(attempt(bundle, "connect", privateName), "ENOENT");
}

TEST_F(ConfinedApplication, ReachesASocketThatIsMadeAgainWhileItRuns) {
  const auto bundle = house_.installProbe("org.a");
  ASSERT_FALSE(prepareRuntimeDirectories(house_.paths));
  const std::string first = house_.paths.publicSockets + "/first";
  const std::string second = house_.paths.publicSockets + "/second";
  const auto gate = listenAt(first, /*offset=*/0);
  auto process = ConfinedHouse::start(house_.plan(bundle, {"stay-connected", first, "connect", second}));
  {
    const UniqueDescriptor connection(::accept4(gate.get(), nullptr, nullptr, SOCK_CLOEXEC));
    ASSERT_TRUE(connection);
    { const auto old = listenAt(second, /*offset=*/0); }
    ::unlink(second.c_str());
    const auto made = listenAt(second, /*offset=*/0);
    // Its going lets the probe go on while `made` listens.
    ::shutdown(connection.get(), SHUT_RDWR);
    EXPECT_EQ(ConfinedHouse::outcomes(std::move(process)).at("connect " + second), "ok");
  }
}

TEST_F(ConfinedApplication, GetsTheStandardDescriptorsAlone) {
  const auto bundle = house_.installProbe("org.a");
  const UniqueDescriptor leaked(::open("/dev/null", O_RDONLY));
  ASSERT_GE(::dup2(leaked.get(), 50), 0);
  EXPECT_EQ(attempt(bundle, "numbers", "/proc/self/fd"), "0 1 2");
  ::close(50);
}

// A key that is for its possessors alone is listed for nobody else.
TEST_F(ConfinedApplication, HasNoneOfTheLaunchersKeys) {
  constexpr std::uint32_t kEverythingToPossessors = 0x3F000000U;
  const tests::KeyQuota quota;
  const long key = tests::KeyQuota::add("docuvend-test", 1);
  ASSERT_GE(key, 0);
  ASSERT_EQ(::syscall(SYS_keyctl, KEYCTL_SETPERM, key, kEverythingToPossessors), 0);
  EXPECT_EQ(house_.runUnconfined({"key", "docuvend-test"}).at("key docuvend-test"), "listed");
  EXPECT_EQ(attempt(house_.installProbe("org.a"), "key", "docuvend-test"), "not listed");
}

TEST_F(ConfinedApplication, ReopensNoPassedDescriptorForWriting) {
  const auto bundle = house_.installProbe("org.a");
  const std::string path = house_.paths.home + "/passed";
  BundleHouse::write(path, "x");
  const UniqueDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  EXPECT_EQ(house_.run(bundle, {"reopen", "0"}, file.get()).at("reopen 0"), "EACCES");
}

TEST_F(ConfinedApplication, ClimbsOutOfNoPassedDirectory) {
  const auto bundle = house_.installProbe("org.a");
  BundleHouse::write(house_.paths.home + "/secret", "x");
  BundleHouse::write(house_.paths.home + "/passed/inner", "x");
  const UniqueDescriptor directory(::open((house_.paths.home + "/passed").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  const auto outcomes = house_.run(bundle, {"from-standard-input", "../secret", "from-standard-input", "inner"}, directory.get());
  EXPECT_EQ(outcomes.at("from-standard-input ../secret"), "EACCES");
  EXPECT_EQ(outcomes.at("from-standard-input inner"), "EACCES");
}

TEST_F(ConfinedApplication, SharesAGroupContainerWithItsMembersAlone) {
  const std::string members =
      BundleHouse::entry("QXGroupMembers", "<dict><key>org.a.docs</key>" + BundleHouse::array({"org.b"}) + "</dict>");
  (void)house_.installProbe("org.a", groups({"org.a.docs"}) + members);
  (void)house_.installProbe("org.b", groups({"org.a.docs"}));
  (void)house_.installProbe("org.c", groups({"org.a.docs"}));
  const auto bundles = house_.scan();
  const std::string file = house_.paths.groupContainers + "/org.a.docs/file";
  EXPECT_EQ(attempt(bundles.at("org.a"), "create", file), "ok");
  EXPECT_EQ(attempt(bundles.at("org.b"), "write", file), "ok");
  EXPECT_EQ(attempt(bundles.at("org.c"), "read", file), "ENOENT");
  EXPECT_EQ(attempt(bundles.at("org.c"), "list", house_.paths.groupContainers), "ENOENT");
}

TEST_F(ConfinedApplication, WithoutANetworkStillReachesPublicSockets) {
  const auto bundle = house_.installProbe("org.a");
  auto plan = house_.plan(bundle, {"connect", house_.paths.publicSockets + "/s", "abstract", "docuvend-test-old"});
  const auto publicListener = listenAt(house_.paths.publicSockets + "/s", /*offset=*/0);
  const auto abstractListener = listenAt("docuvend-test-old", /*offset=*/1);
  plan.arguments.insert(plan.arguments.begin() + 1, "--unshare-net");
  const auto outcomes = ConfinedHouse::outcomes(ConfinedHouse::start(std::move(plan)));
  EXPECT_EQ(outcomes.at("connect " + house_.paths.publicSockets + "/s"), "ok");
  EXPECT_THAT(outcomes.at("abstract docuvend-test-old"), Not("ok"));
}

TEST_F(ConfinedApplication, EndsWithWhoStartedIt) {
  const auto bundle = house_.installProbe("org.a");
  ASSERT_FALSE(prepareRuntimeDirectories(house_.paths));
  const std::string gateName = house_.paths.publicSockets + "/gate";
  const auto gate = listenAt(gateName, /*offset=*/0);
  auto process = ConfinedHouse::start(house_.plan(bundle, {"stay-connected", gateName}));
  const UniqueDescriptor connection(::accept4(gate.get(), nullptr, nullptr, SOCK_CLOEXEC));
  ASSERT_TRUE(connection);
  ASSERT_EQ(::kill(process.pid(), SIGKILL), 0);
  char byte = 0;
  EXPECT_EQ(::read(connection.get(), &byte, 1), 0);
  EXPECT_EQ(process.status(), 128 + SIGKILL);
}

constexpr rlim_t kFewSignals = 150;
constexpr rlim_t kLittleLockedMemory = 8192;

rlim_t halfOfOwn(__rlimit_resource resource, rlim_t most) {
  rlimit own{};
  EXPECT_EQ(::getrlimit(resource, &own), 0);
  return std::min<rlim_t>(own.rlim_cur / 2, most);
}
rlim_t pendingSignalsOfALaunch() { return halfOfOwn(RLIMIT_SIGPENDING, kConfinedPendingSignals); }
rlim_t lockedMemoryOfALaunch() { return halfOfOwn(RLIMIT_MEMLOCK, kConfinedLockedMemory); }

// Of this process, and so of what it launches from now on: a machine with little memory begins with few signals.
void lower(__rlimit_resource resource, rlim_t most) {
  rlimit own{};
  ASSERT_EQ(::getrlimit(resource, &own), 0);
  own.rlim_cur = most;
  ASSERT_EQ(::setrlimit(resource, &own), 0);
}

// What the user may have is shared with the daemon.
TEST_F(ConfinedApplication, IsLimited) {
  rlimit processes{};
  rlimit files{};
  ASSERT_EQ(::getrlimit(RLIMIT_NPROC, &processes), 0);
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &files), 0);
  files = {300, std::min<rlim_t>(files.rlim_max, 4 * kApplicationOpenFiles)};
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &files), 0);
  const auto bundle = house_.installProbe("org.a");
  const std::string openFiles = std::to_string(std::min<rlim_t>(files.rlim_max / 2, kApplicationOpenFiles));
  EXPECT_EQ(attempt(bundle, "limit", "open files"), "300 of " + openFiles) << "what is asked for by default stays";
  EXPECT_EQ(attempt(bundle, "limit", "processes"), std::to_string(std::min<rlim_t>(processes.rlim_cur / 2, kApplicationProcesses)));
  EXPECT_EQ(attempt(bundle, "limit", "memory"), std::to_string(RLIM_INFINITY));
  EXPECT_EQ(attempt(bundle, "limit", "pending signals"), std::to_string(pendingSignalsOfALaunch()));
  EXPECT_EQ(attempt(bundle, "limit", "locked memory"), std::to_string(lockedMemoryOfALaunch()));
  EXPECT_EQ(attempt(bundle, "limit", "message queues"), "0");
  lower(RLIMIT_SIGPENDING, 2 * kFewSignals);
  lower(RLIMIT_MEMLOCK, 2 * kLittleLockedMemory);
  EXPECT_EQ(attempt(bundle, "limit", "pending signals"), std::to_string(kFewSignals));
  EXPECT_EQ(attempt(bundle, "limit", "locked memory"), std::to_string(kLittleLockedMemory));
}

class ConfinedExtension : public ConfinedTest {
 protected:
  [[nodiscard]] Outcomes run(const std::vector<std::string>& attempts) {
    auto [ours, theirs] = makeSocketPair();
    return ConfinedHouse::outcomes(ConfinedHouse::start(house_.planExtension(house_.installProbe("org.x"), attempts, std::move(theirs))));
  }
};

TEST_F(ConfinedExtension, TalksThroughTheSocketThatItInherits) {
  auto [ours, theirs] = makeSocketPair();
  auto process = ConfinedHouse::start(house_.planExtension(house_.installProbe("org.x"), {"echo", "once"}, std::move(theirs)));
  ASSERT_EQ(::write(ours.get(), "a", 1), 1);
  char byte = 0;
  EXPECT_EQ(::read(ours.get(), &byte, 1), 1);
  EXPECT_EQ(byte, 'a');
  EXPECT_EQ(::read(ours.get(), &byte, 1), 0);
  EXPECT_EQ(ConfinedHouse::outcomes(std::move(process)).at("echo once"), "ok");
}

TEST_F(ConfinedExtension, GetsItsSocketAndTheStandardDescriptorsAlone) {
  const UniqueDescriptor leaked(::open("/dev/null", O_RDONLY));
  ASSERT_GE(::dup2(leaked.get(), 50), 0);
  EXPECT_EQ(run({"numbers", "/proc/self/fd"}).at("numbers /proc/self/fd"), "0 1 2 3");
  ::close(50);
}

TEST_F(ConfinedExtension, SeesNoSocketDirectory) {
  ASSERT_FALSE(prepareRuntimeDirectories(house_.paths));
  const auto outcomes = run({"variables", "all", "stat", house_.paths.publicSockets});
  EXPECT_EQ(outcomes.at("variables all"), "HOME LANG PATH PWD TMPDIR");
  EXPECT_EQ(outcomes.at("stat " + house_.paths.publicSockets), "ENOENT");
}

TEST_F(ConfinedExtension, IsLimited) {
  const auto outcomes = run({"limit", "processes", "limit", "memory", "limit", "open files", "limit", "pending signals", "limit",
                             "locked memory", "limit", "message queues"});
  EXPECT_EQ(outcomes.at("limit processes"), std::to_string(kExtensionProcesses));
  EXPECT_EQ(outcomes.at("limit memory"), std::to_string(kExtensionMemory.value_or(RLIM_INFINITY)));
  EXPECT_EQ(outcomes.at("limit open files"), std::to_string(kExtensionOpenFiles));
  EXPECT_EQ(outcomes.at("limit pending signals"), std::to_string(pendingSignalsOfALaunch()));
  EXPECT_EQ(outcomes.at("limit locked memory"), std::to_string(lockedMemoryOfALaunch()));
  EXPECT_EQ(outcomes.at("limit message queues"), "0");
  lower(RLIMIT_SIGPENDING, 2 * kFewSignals);
  lower(RLIMIT_MEMLOCK, 2 * kLittleLockedMemory);
  const auto lowered = run({"limit", "pending signals", "limit", "locked memory"});
  EXPECT_EQ(lowered.at("limit pending signals"), std::to_string(kFewSignals));
  EXPECT_EQ(lowered.at("limit locked memory"), std::to_string(kLittleLockedMemory));
}

// Both are counted for the user, whose other processes need them.
TEST_F(ConfinedExtension, AndAnApplicationMakeNoMessageQueueAndLockLittleSharedMemory) {
  const rlim_t page = static_cast<rlim_t>(::sysconf(_SC_PAGESIZE));
  const rlim_t most = lockedMemoryOfALaunch() / page * page;
  ASSERT_GT(most, 0U) << "who runs this may lock nothing";
  const std::string allowed = std::to_string(most);
  const std::string tooMuch = std::to_string(most + page);
  const std::vector<std::string> attempts = {"make-message-queue", "one", "lock-shared-memory", allowed, "lock-shared-memory", tooMuch};

  const auto outside = house_.runUnconfined(attempts);
  EXPECT_EQ(outside.at("make-message-queue one"), "ok");
  EXPECT_EQ(outside.at("lock-shared-memory " + allowed), "ok");
  EXPECT_EQ(outside.at("lock-shared-memory " + tooMuch), "ok");
  for (const auto& inside : {house_.run(house_.installProbe("org.a"), attempts), run(attempts)}) {
    EXPECT_EQ(inside.at("make-message-queue one"), "EMFILE");
    EXPECT_EQ(inside.at("lock-shared-memory " + allowed), "ok");
    EXPECT_EQ(inside.at("lock-shared-memory " + tooMuch), "ENOMEM");
  }
}

// Counted within its own confinement: the user's other processes take nothing away.
TEST_F(ConfinedExtension, StartsNoMoreProcessesThanItsLimit) {
  const int count = std::stoi(run({"fork", "all"}).at("fork all"));
  EXPECT_LT(count, static_cast<int>(kExtensionProcesses));
  EXPECT_GT(count, static_cast<int>(kExtensionProcesses) / 2);
}

class LaunchPlanning : public ConfinedTest {};

TEST_F(LaunchPlanning, RefusesAHomeThatEveryApplicationWouldSee) {
  const auto bundle = house_.installProbe("org.a");
  house_.paths.home = "/usr/local/home";
  for (const LaunchKind kind : {LaunchKind::application, LaunchKind::extension}) {
    auto socket = kind == LaunchKind::extension ? std::optional(makeSocketPair().theirs) : std::nullopt;
    EXPECT_THAT(errorOf(planLaunch(bundle, {}, kind, std::move(socket), house_.paths)),
                HasSubstr("/usr/local/home lies below /usr, which every application sees"));
  }
}

TEST_F(LaunchPlanning, GivesASocketToExtensionsAlone) {
  const auto bundle = house_.installProbe("org.a");
  EXPECT_THAT(errorOf(planLaunch(bundle, {}, LaunchKind::extension, std::nullopt, house_.paths)), HasSubstr("is given a socket"));
  EXPECT_THAT(errorOf(planLaunch(bundle, {}, LaunchKind::application, std::move(makeSocketPair().theirs), house_.paths)),
              HasSubstr("is given a socket"));
}

TEST_F(LaunchPlanning, RefusesAContainerThatIsALink) {
  const auto bundle = house_.installProbe("org.a");
  std::filesystem::create_directories(house_.paths.containers);
  std::filesystem::create_directory_symlink(house_.paths.home, bundle.container);
  EXPECT_THAT(errorOf(planLaunch(bundle, {}, LaunchKind::application, std::nullopt, house_.paths)), HasSubstr("is no directory"));
}

TEST_F(LaunchPlanning, RefusesARunTimeDirectoryThatOthersCanEnter) {
  const auto bundle = house_.installProbe("org.a");
  std::filesystem::create_directories(house_.paths.publicSockets);
  ::chmod(house_.paths.runtime.c_str(), 0755);
  EXPECT_THAT(errorOf(planLaunch(bundle, {}, LaunchKind::application, std::nullopt, house_.paths)), HasSubstr("must have mode 700"));
}

TEST_F(LaunchPlanning, RefusesABundleThatIsGone) {
  const auto bundle = house_.installProbe("org.a");
  std::filesystem::remove_all(bundle.directory);
  EXPECT_THAT(errorOf(planLaunch(bundle, {}, LaunchKind::application, std::nullopt, house_.paths)), HasSubstr("cannot resolve"));
}

TEST_F(LaunchPlanning, RefusesAnExecutableThatBecameALinkOutOfTheBundle) {
  const auto bundle = house_.installProbe("org.a");
  std::filesystem::remove(bundle.executable);
  std::filesystem::create_symlink("/usr/bin/env", bundle.executable);
  EXPECT_THAT(errorOf(planLaunch(bundle, {}, LaunchKind::application, std::nullopt, house_.paths)), HasSubstr("lies outside its bundle"));
}

TEST_F(LaunchPlanning, EveryLaunchHasItsOwnInstance) {
  const auto bundle = house_.installProbe("org.a");
  std::vector<std::string> texts;
  for (int i = 0; i < 2; ++i) {
    const auto plan = house_.plan(bundle, {});
    std::array<char, kLongestDescription> text{};
    const ssize_t count = ::read(plan.inherited.back().descriptor.get(), text.data(), text.size());
    texts.emplace_back(text.data(), static_cast<std::size_t>(count));
  }
  EXPECT_NE(texts[0], texts[1]);
}

}  // namespace
}  // namespace docuvend::linux_platform
