// The calls that are refused inside a confinement, tried there by the probe, and beside them their honest neighbours.
#include "platform/linux/launch/policy/SystemCalls.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <map>
#include <stdexcept>
#include <string>
#include <vector>

#include "tests/launch/ConfinedHouse.h"
#include "tests/support/KeyQuota.h"

namespace docuvend::linux_platform {
namespace {

using Names = std::vector<std::string>;

class SystemCalls : public ConfinedTest {
 protected:
  // Calls of the probe as an application, as an extension, and as what it is outside.
  [[nodiscard]] std::map<std::string, std::string> inside(const Names& names, int standardInput = -1) {
    return said(names, house_.run(house_.installProbe("org.a"), attempts(names), standardInput));
  }
  [[nodiscard]] std::map<std::string, std::string> insideAnExtension(const Names& names) {
    std::array<int, 2> ends{};
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) throw std::runtime_error("no socket pair");
    const UniqueDescriptor ours(ends[0]);
    UniqueDescriptor theirs(ends[1]);
    return said(names, ConfinedHouse::outcomes(
                           ConfinedHouse::start(house_.planExtension(house_.installProbe("org.x"), attempts(names), std::move(theirs)))));
  }
  [[nodiscard]] std::map<std::string, std::string> outside(const Names& names, int standardInput = -1) {
    return said(names, house_.runUnconfined(attempts(names), standardInput));
  }

  static std::map<std::string, std::string> all(const Names& names, const std::string& outcome) {
    std::map<std::string, std::string> result;
    for (const auto& name : names) result[name] = outcome;
    return result;
  }

 private:
  static std::vector<std::string> attempts(const Names& names) {
    std::vector<std::string> words;
    for (const auto& name : names) words.insert(words.end(), {"call", name});
    return words;
  }
  static std::map<std::string, std::string> said(const Names& names, const Outcomes& outcomes) {
    std::map<std::string, std::string> result;
    for (const auto& name : names) {
      const auto found = outcomes.find("call " + name);
      result[name] = found == outcomes.end() ? "never said; status " + outcomes.at("status") : found->second;
    }
    return result;
  }
};

TEST_F(SystemCalls, OfKeysAndRingsAreNotThere) {
  const Names names = {"add_key", "request_key", "keyctl", "io_uring_setup", "io_uring_enter", "io_uring_register"};
  EXPECT_EQ(inside(names), all(names, "ENOSYS"));
  EXPECT_EQ(insideAnExtension(names), all(names, "ENOSYS"));
}

TEST_F(SystemCalls, OfLeasesAreLeftToExtensions) {
  const Names leases = {"lease", "lease-with-a-high-half"};
  EXPECT_EQ(outside(leases), all(leases, "ok"));
  EXPECT_EQ(inside(leases), all(leases, "EINVAL"));
  EXPECT_EQ(insideAnExtension(leases), all(leases, "ok"));
}

// It keeps away who would write, beside any number that read: that tells a provider nothing which it needs.
TEST_F(SystemCalls, OfLeasesThoseForReadingAreLeftToNobody) {
  const Names leases = {"lease-for-reading", "lease-for-reading-with-high-halves"};
  EXPECT_EQ(outside(leases), all(leases, "ok"));
  EXPECT_EQ(inside(leases), all(leases, "EINVAL"));
  EXPECT_EQ(insideAnExtension(leases), all(leases, "EINVAL"));
  // A lease that it has it gives back: there is none here, which is what the kernel says of it.
  EXPECT_EQ(insideAnExtension({"lease-given-back"}), all({"lease-given-back"}, "EAGAIN"));
}

// Not every kernel has them. Outside, each looks at the file first.
TEST_F(SystemCalls, OfDelegationsAreLeftToNobody) {
  const Names delegations = {"delegation", "delegation-with-a-high-half"};
  EXPECT_EQ(outside(delegations), all(delegations, "EBADF"));
  EXPECT_EQ(inside(delegations), all(delegations, "EINVAL"));
  EXPECT_EQ(insideAnExtension(delegations), all(delegations, "EINVAL"));
}

TEST_F(SystemCalls, OfFilesOtherThanLeasesAreMade) {
  const Names others = {"lease-asked-for", "lock", "lock-of-description"};
  EXPECT_EQ(inside(others), all(others, "ok"));
}

TEST_F(SystemCalls, ThatLetAnotherProcessWaitForItsCloseAreRefused) {
  const Names lingers = {"linger", "linger-with-high-halves"};
  EXPECT_EQ(outside(lingers), all(lingers, "ok"));
  EXPECT_EQ(inside(lingers), all(lingers, "ENOPROTOOPT"));
  EXPECT_EQ(insideAnExtension(lingers), all(lingers, "ENOPROTOOPT"));

  const Names others = {"linger-asked-for", "same-level-as-linger", "same-number-as-linger"};
  EXPECT_EQ(inside(others), all(others, "ok"));
}

TEST_F(SystemCalls, MakeSocketsOfTheNetworkAndOfThisMachineOnly) {
  const Names toTheHost = {"vsock", "vsock-with-a-high-half"};
  EXPECT_EQ(inside(toTheHost), all(toTheHost, "EAFNOSUPPORT"));
  EXPECT_EQ(insideAnExtension(toTheHost), all(toTheHost, "EAFNOSUPPORT"));

  const Names others = {"unix", "inet", "inet6"};
  const auto expected = outside(others);  // a machine may have no IPv6
  EXPECT_EQ(expected.at("unix"), "ok");
  EXPECT_EQ(inside(others), expected);
}

// A socket of ciphers takes a key of the user's by its number, which no keyring call is needed for.
TEST_F(SystemCalls, MakeNoSocketThatTakesAKey) {
  const Names ciphers = {"cipher", "cipher-with-a-high-half"};
  EXPECT_EQ(outside(ciphers), all(ciphers, "EINVAL"));
  EXPECT_EQ(inside(ciphers), all(ciphers, "EAFNOSUPPORT"));
  EXPECT_EQ(insideAnExtension(ciphers), all(ciphers, "EAFNOSUPPORT"));
}

TEST_F(SystemCalls, TypeIntoNoTerminalAndAskOneWhatItIs) {
  const Names typing = {"type", "type-with-a-high-half", "paste", "paste-with-a-high-half"};
  EXPECT_EQ(outside(typing), all(typing, "ENOTTY"));
  EXPECT_EQ(inside(typing), all(typing, "EPERM"));
  EXPECT_EQ(insideAnExtension(typing), all(typing, "EPERM"));

  const UniqueDescriptor terminal(::posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC));
  ASSERT_EQ(::grantpt(terminal.get()), 0);
  ASSERT_EQ(::unlockpt(terminal.get()), 0);
  const UniqueDescriptor shell(::open(::ptsname(terminal.get()), O_RDWR | O_NOCTTY | O_CLOEXEC));
  ASSERT_TRUE(shell);
  EXPECT_EQ(inside({"terminal-state"}, shell.get()), all({"terminal-state"}, "ok"));
}

// A file system has these, whatever Landlock knows of devices. No socket has: outside they are not refused, but unknown.
TEST_F(SystemCalls, ChangeNothingOfAFileSystemThatOthersShare) {
  const Names sharing = {"add-encryption-key", "remove-encryption-key", "remove-encryption-key-of-all",
                         "enable-verity",      "make-snapshot",         "make-snapshot-2"};
  EXPECT_EQ(outside(sharing), all(sharing, "ENOTTY"));
  EXPECT_EQ(inside(sharing), all(sharing, "EPERM"));
  EXPECT_EQ(insideAnExtension(sharing), all(sharing, "EPERM"));
  EXPECT_EQ(inside({"read-version"}), all({"read-version"}, "ENOTTY"));
}

TEST_F(SystemCalls, WatchNoFilesForAllOfTheUsersProcesses) {
  EXPECT_EQ(outside({"fanotify_init"}), all({"fanotify_init"}, "ok"));
  EXPECT_EQ(inside({"fanotify_init"}), all({"fanotify_init"}, "ENOSYS"));
  EXPECT_EQ(insideAnExtension({"fanotify_init"}), all({"fanotify_init"}, "ENOSYS"));
}

// Their numbers mean other calls.
TEST_F(SystemCalls, OfAnotherArchitectureEndTheProcess) {
  const Names others = {"i386", "x32"};
  const auto expected = outside(others).at("x32") == "another machine" ? "another machine" : "SIGSYS";
  EXPECT_EQ(inside(others), all(others, expected));
  EXPECT_EQ(insideAnExtension(others), all(others, expected));
}

TEST_F(SystemCalls, ThatAreNoneAreAnswered) {
  const Names none = {"no-call", "unknown-call"};
  EXPECT_EQ(inside(none), all(none, "ENOSYS"));
}

// The quota is one for all of the user's processes; those outside can still use it up.
TEST_F(SystemCalls, NeedNoKeyOfTheUsersForALaunch) {
  tests::KeyQuota quota;
  quota.useUp();
  EXPECT_EQ(inside({"unix"}), all({"unix"}, "ok"));
  EXPECT_EQ(insideAnExtension({"unix"}), all({"unix"}, "ok"));
}

}  // namespace
}  // namespace docuvend::linux_platform
