#include "platform/linux/identity/LinuxPeerDirectory.h"
#include "platform/linux/base/Sanitizers.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <ostream>
#include <utility>
#include <vector>

#include "platform/linux/launch/LaunchDescription.h"
#include "tests/launch/PeerTest.h"

namespace docuvend::linux_platform {

// Found by the test library, which names each test's kernel with it.
static void PrintTo(const KernelFacilities& kernel, std::ostream* stream) {
  *stream << "Without" << (kernel.peerPidfd ? "" : "PeerPidfds") << (kernel.pidfdNamespaces ? "" : "PidfdNamespaces")
          << (kernel.uniquePidfdInodes ? "" : "UniqueInodes");
}

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using Identity = std::shared_ptr<const PeerIdentity>;

class LinuxPeerDirectoryTest : public PeerTest {
 protected:
  [[nodiscard]] Identity identify(const Peer& peer) { return directory_.identify(peer.connection.get()); }
  [[nodiscard]] std::string lastReason() const {
    const auto texts = house_.log.texts(QXLogType::debug);
    return texts.empty() ? "" : texts.back();
  }
  static void expectNobody(const Identity& identity) {
    ASSERT_TRUE(identity);
    EXPECT_EQ(identity->standing, Standing::nobody);
    EXPECT_EQ(identity->token, QXAuditToken{});
    EXPECT_FALSE(identity->bundleIdentifier);
    EXPECT_TRUE(identity->entitlements.empty());
  }
  // Of the bundle that is installed, if one is.
  [[nodiscard]] std::string description(const std::string& identifier) {
    const auto bundle = bundles_.find(identifier);
    return descriptionText({identifier, bundle ? bundle->incarnation : "0", "0123456789abcdef0123456789abcdef", LaunchKind::application});
  }
  // Removes the bundle and installs it again, as another maker's, or its own next version, would be.
  void replace(const std::string& identifier) {
    std::filesystem::remove_all(house_.paths.userBundles + "/" + identifier);
    (void)install(identifier);
  }

  LinuxPeerDirectory directory_{bundles_, house_.log.defaultLog()};
};

TEST_F(LinuxPeerDirectoryTest, AConfinedProcessIsItsBundle) {
  const auto peer = confined(install("org.a"));
  const auto identity = identify(peer);
  EXPECT_EQ(identity->standing, Standing::confined);
  EXPECT_EQ(identity->bundleIdentifier, "org.a");
  EXPECT_EQ(identity->instance.size(), 32U);
  EXPECT_EQ(identity->uid, ::geteuid());
  EXPECT_NE(qxFind<bool>(identity->entitlements, "right-of-org.a"), nullptr);
  EXPECT_NE(identity->token, QXAuditToken{});
  EXPECT_EQ(directory_.find(identity->token), identity);
}

TEST_F(LinuxPeerDirectoryTest, AnOrphanOfAConfinedProcessIsTheSameBundle) {
  const auto peer = confined(install("org.a"), "stay-connected-as-orphan");
  const auto identity = identify(peer);
  EXPECT_EQ(identity->standing, Standing::confined);
  EXPECT_EQ(identity->bundleIdentifier, "org.a");
}

TEST_F(LinuxPeerDirectoryTest, TwoLaunchesOfOneBundleAreTwoInstances) {
  const auto bundle = install("org.a");
  const auto one = confined(bundle);
  const auto other = confined(bundle);
  const auto oneIdentity = identify(one);
  const auto otherIdentity = identify(other);
  EXPECT_EQ(oneIdentity->bundleIdentifier, otherIdentity->bundleIdentifier);
  EXPECT_NE(oneIdentity->instance, otherIdentity->instance);
  EXPECT_NE(oneIdentity->token, otherIdentity->token);
}

TEST_F(LinuxPeerDirectoryTest, EntitlementsAreThoseThatTheBundleHadWhenThePeerConnected) {
  const auto peer = confined(install("org.a"));
  const auto identity = identify(peer);
  bundles_.bundles.at("org.a").entitlements.clear();
  EXPECT_EQ(directory_.find(identity->token)->entitlements.size(), 1U);
  EXPECT_TRUE(identify(peer)->entitlements.empty());
}

TEST_F(LinuxPeerDirectoryTest, AnOrdinaryProcessIsUnconfinedAndBelongsToNoBundle) {
  const auto peer = unconfined();
  const auto identity = identify(peer);
  EXPECT_EQ(identity->standing, Standing::unconfined);
  EXPECT_EQ(identity->pid, peer.process.pid());
  EXPECT_FALSE(identity->bundleIdentifier);
  EXPECT_TRUE(identity->entitlements.empty());
  EXPECT_TRUE(identity->instance.empty());
  EXPECT_NE(identity->token, QXAuditToken{});
}

TEST_F(LinuxPeerDirectoryTest, TheTokenIsProcessUserSerialAndBoot) {
  const auto peer = unconfined();
  const auto identity = identify(peer);
  struct stat status {};
  ASSERT_EQ(::fstat(identity->pidfd.get(), &status), 0);
  pid_t pid = 0;
  uid_t uid = 0;
  std::uint64_t serial = 0;
  std::memcpy(&pid, identity->token.bytes.data(), 4);
  std::memcpy(&uid, identity->token.bytes.data() + 4, 4);
  std::memcpy(&serial, identity->token.bytes.data() + 8, 8);
  EXPECT_EQ(pid, identity->pid);
  EXPECT_EQ(uid, identity->uid);
  EXPECT_EQ(serial, status.st_ino);
  EXPECT_NE((std::string{identity->token.bytes.begin() + 16, identity->token.bytes.end()}), std::string(16, '\0'));
}

TEST_F(LinuxPeerDirectoryTest, OneProcessHasOneTokenOnAllItsConnections) {
  const auto peer = unconfined();
  EXPECT_EQ(identify(peer)->token, identify(peer)->token);
  const auto other = unconfined();
  EXPECT_NE(identify(other)->token, identify(peer)->token);
}

TEST_F(LinuxPeerDirectoryTest, ADeadPeerIsNobody) {
  auto peer = unconfined();
  ASSERT_EQ(::kill(peer.process.pid(), SIGKILL), 0);
  EXPECT_EQ(peer.process.status(), 128 + SIGKILL);
  expectNobody(identify(peer));
}

TEST_F(LinuxPeerDirectoryTest, AConfinedProcessWhoseBundleIsGoneIsNobody) {
  const auto peer = confined(install("org.a"));
  bundles_.bundles.clear();
  const Identity identity = identify(peer);
  expectNobody(identity);
  EXPECT_THAT(house_.log.entries(),
              ElementsAre(fake_platform::FakeLogEntry{
                  QXLogType::debug, "[DEBUG] PID " + std::to_string(identity->pid) + " is nobody: its bundle org.a is not installed."}));
}

TEST_F(LinuxPeerDirectoryTest, AConfinedProcessIsNotTheBundleThatTookItsBundlesPlace) {
  const auto old = confined(install("org.a"));
  const auto before = identify(old);
  ASSERT_EQ(before->bundleIdentifier, "org.a");
  EXPECT_TRUE(directory_.isCurrent(*before));
  replace("org.a");
  EXPECT_FALSE(directory_.isCurrent(*before)) << "also over a connection that it has";
  house_.log.clear();
  expectNobody(identify(old));
  const std::string who = "PID " + std::to_string(before->pid);
  EXPECT_THAT(
      house_.log.entries(),
      ElementsAre(
          fake_platform::FakeLogEntry{
              QXLogType::defaultType,
              "[NOTICE] " + who + " was started from another bundle org.a than the one that is installed now; it is to be started again."},
          fake_platform::FakeLogEntry{QXLogType::debug,
                                      "[DEBUG] " + who + " is nobody: its bundle org.a is not the one that is installed."}));
  const auto anew = confined(bundles_.bundles.at("org.a"));
  const auto after = identify(anew);
  EXPECT_EQ(after->bundleIdentifier, "org.a");
  EXPECT_TRUE(directory_.isCurrent(*after));
  EXPECT_FALSE(directory_.isCurrent(*before));
}

TEST_F(LinuxPeerDirectoryTest, AConfinedProcessIsItsBundleAlsoWhenThatIsEditedOrRenamedOrAnotherGoes) {
  (void)install("org.b");
  const auto peer = confined(install("org.a"));
  const auto before = identify(peer);
  const std::string place = house_.paths.userBundles + "/org.a";
  BundleHouse::write(place + "/Entitlements.plist", BundleHouse::propertyList("<key>another-right</key><true/>"));
  BundleHouse::write(place + "/new-file", "new");
  replace("org.b");
  std::filesystem::rename(place, house_.paths.userBundles + "/elsewhere");
  bundles_.bundles = house_.scan();
  EXPECT_TRUE(directory_.isCurrent(*before));
  const auto after = identify(peer);
  EXPECT_EQ(after->bundleIdentifier, "org.a");
  EXPECT_NE(qxFind<bool>(after->entitlements, "another-right"), nullptr);
}

TEST_F(LinuxPeerDirectoryTest, WhoIsNotConfinedStaysWhoItIsWhateverIsInstalled) {
  (void)install("org.a");
  const auto peer = unconfined();
  const auto plain = identify(peer);
  const auto declared = directory_.declare(*plain, "org.a");
  ASSERT_TRUE(declared);
  const auto confinedPeer = confined(bundles_.bundles.at("org.a"));
  const auto confinedIdentity = identify(confinedPeer);
  bundles_.bundles.clear();
  EXPECT_TRUE(directory_.isCurrent(*plain));
  EXPECT_TRUE(directory_.isCurrent(*declared));
  EXPECT_FALSE(directory_.isCurrent(*confinedIdentity));
}

TEST_F(LinuxPeerDirectoryTest, NamespacesWithoutADescriptionAreNobodys) {
  const auto peer = unconfined({"enter", "once"});
  expectNobody(identify(peer));
  EXPECT_THAT(lastReason(), HasSubstr("cannot open its description"));
}

TEST_F(LinuxPeerDirectoryTest, NamespacesThatWereMadeInsideNamespacesAreNobodys) {
  const auto peer = unconfined({"enter", "once", "enter", "twice"});
  expectNobody(identify(peer));
  EXPECT_THAT(lastReason(), HasSubstr("its mount namespace was made inside a confinement"));
}

// As somebody would who can make namespaces where a confined process cannot.
TEST_F(LinuxPeerDirectoryTest, ADescriptionThatWasMountedInsideAConfinementIsNotBelieved) {
  (void)install("org.a");
  const std::string place = house_.root() + "/forged";
  BundleHouse::write(place + "/.docuvend-info", description("org.a"));
  const auto peer = unconfined({"enter", "once", "enter", "twice", "bind", place, "chroot", place});
  expectNobody(identify(peer));
  EXPECT_THAT(lastReason(), HasSubstr("its mount namespace was made inside a confinement"));
}

TEST_F(LinuxPeerDirectoryTest, ARootThatIsAPlainDirectoryIsNotBelieved) {
  (void)install("org.a");
  const std::string place = house_.root() + "/forged";
  BundleHouse::write(place + "/.docuvend-info", description("org.a"));
  const auto peer = unconfined({"enter", "once", "chroot", place});
  expectNobody(identify(peer));
  EXPECT_THAT(lastReason(), HasSubstr("its root is not that of a mount"));
}

TEST_F(LinuxPeerDirectoryTest, AMalformedDescriptionIsNobodys) {
  (void)install("org.a");
  const std::string file = house_.root() + "/description";
  struct Case {
    std::string text;
    std::string reason;
  };
  for (const auto& [text, reason] : std::vector<Case>{{description("org.a") + "name=org.b\n", "malformed"},
                                                      {description("../org.a"), "malformed"},
                                                      {"", "malformed"},
                                                      {std::string(kLongestDescription + 1, 'x'), "too long"},
                                                      {description("org.missing"), "org.missing is not installed"}}) {
    BundleHouse::write(file, text);
    const auto peer = handMade({"--ro-bind", file, "/.docuvend-info"});
    expectNobody(identify(peer));
    EXPECT_THAT(lastReason(), HasSubstr(reason));
  }
}

// What makes the tests above mean something: the same by hand, but well-formed.
TEST_F(LinuxPeerDirectoryTest, TheLauncherIsWhoeverMakesTheConfinementOutside) {
  (void)install("org.a");
  const std::string file = house_.root() + "/description";
  BundleHouse::write(file, description("org.a"));
  const auto peer = handMade({"--ro-bind", file, "/.docuvend-info"});
  EXPECT_EQ(identify(peer)->bundleIdentifier, "org.a");
}

TEST_F(LinuxPeerDirectoryTest, ADescriptionThatIsALinkOrAPipeOrADirectoryIsNobodys) {
  (void)install("org.a");
  const std::string file = house_.root() + "/description";
  BundleHouse::write(file, description("org.a"));
  {
    const auto peer = handMade({"--symlink", file, "/.docuvend-info"});
    expectNobody(identify(peer));
    EXPECT_THAT(lastReason(), HasSubstr("cannot open its description"));
  }
  const std::string pipe = house_.root() + "/pipe";
  ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
  {
    const auto peer = handMade({"--ro-bind", pipe, "/.docuvend-info"});
    expectNobody(identify(peer));
    EXPECT_THAT(lastReason(), HasSubstr("its description is not a regular file"));
  }
  const auto peer = handMade({"--dir", "/.docuvend-info"});
  expectNobody(identify(peer));
  EXPECT_THAT(lastReason(), HasSubstr("its description is not a regular file"));
}

TEST_F(LinuxPeerDirectoryTest, WhatIsNoSocketIsNobody) {
  const UniqueDescriptor file(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  expectNobody(directory_.identify(file.get()));
}

// Not one descriptor fewer than it takes to look is enough to be taken for nobody.
TEST_F(LinuxPeerDirectoryTest, OfAPeerThatThereAreNoDescriptorsToLookAtWithNothingIsSaid) {
  if (kAddressSanitizer) GTEST_SKIP() << "the sanitizer looks at memory through descriptors of its own";
  const auto peer = unconfined();
  ASSERT_EQ(identify(peer)->standing, Standing::unconfined);
  house_.log.clear();
  rlimit usual{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &usual), 0);
  const rlimit tight{100, usual.rlim_max};
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &tight), 0);
  std::vector<UniqueDescriptor> fillers;
  while (true) {
    UniqueDescriptor filler(::dup(peer.connection.get()));
    if (!filler) break;
    fillers.push_back(std::move(filler));
  }
  int tries = 0;
  Identity identity;
  for (; !identity && !fillers.empty(); ++tries) {
    identity = identify(peer);
    fillers.pop_back();
  }
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &usual), 0);
  ASSERT_TRUE(identity);
  EXPECT_EQ(identity->standing, Standing::unconfined);
  EXPECT_GT(tries, 2) << "it takes several";
  EXPECT_THAT(house_.log.texts(QXLogType::debug), IsEmpty());
}

TEST_F(LinuxPeerDirectoryTest, AnUnconfinedProcessMayDeclareAnInstalledBundle) {
  (void)install("org.a");
  const auto peer = unconfined();
  const auto plain = identify(peer);
  house_.log.clear();
  const auto declared = directory_.declare(*plain, "org.a");
  ASSERT_TRUE(declared);
  EXPECT_EQ(declared->standing, Standing::unconfined);
  EXPECT_EQ(declared->bundleIdentifier, "org.a");
  EXPECT_EQ(declared->token, plain->token);
  EXPECT_EQ(declared->pid, plain->pid);
  EXPECT_NE(qxFind<bool>(declared->entitlements, "right-of-org.a"), nullptr);
  EXPECT_EQ(directory_.find(plain->token), declared);
  EXPECT_THAT(house_.log.entries(),
              ElementsAre(fake_platform::FakeLogEntry{
                  QXLogType::defaultType, "[NOTICE] PID " + std::to_string(peer.process.pid()) + " declares itself to be org.a."}));
}

TEST_F(LinuxPeerDirectoryTest, ABundleThatIsNotInstalledCannotBeDeclared) {
  const auto peer = unconfined();
  EXPECT_FALSE(directory_.declare(*identify(peer), "org.a"));
  EXPECT_THAT(house_.log.texts(QXLogType::defaultType), IsEmpty());
}

TEST_F(LinuxPeerDirectoryTest, AConfinedProcessCannotDeclareAnything) {
  (void)install("org.b");
  const auto peer = confined(install("org.a"));
  const auto identity = identify(peer);
  EXPECT_FALSE(directory_.declare(*identity, "org.b"));
  EXPECT_FALSE(directory_.declare(*identity, "org.a"));
  EXPECT_EQ(directory_.find(identity->token)->bundleIdentifier, "org.a");
}

TEST_F(LinuxPeerDirectoryTest, NobodyCannotDeclareAnything) {
  (void)install("org.a");
  const auto peer = unconfined({"enter", "once"});
  EXPECT_FALSE(directory_.declare(*identify(peer), "org.a"));
}

TEST_F(LinuxPeerDirectoryTest, AProcessDeclaresOneBundleAtATime) {
  (void)install("org.a");
  (void)install("org.b");
  const auto peer = unconfined();
  const auto plain = identify(peer);
  auto first = directory_.declare(*plain, "org.a");
  ASSERT_TRUE(first);
  EXPECT_FALSE(directory_.declare(*plain, "org.b"));
  EXPECT_FALSE(directory_.declare(*first, "org.b"));
  EXPECT_TRUE(directory_.declare(*identify(peer), "org.a"));
  first.reset();
  EXPECT_TRUE(directory_.declare(*plain, "org.b"));
}

TEST_F(LinuxPeerDirectoryTest, WhoseConnectionHasEndedIsNotFound) {
  const auto peer = unconfined();
  auto identity = identify(peer);
  const auto token = identity->token;
  identity.reset();
  EXPECT_FALSE(directory_.find(token));
  EXPECT_FALSE(directory_.find(QXAuditToken{}));
}

TEST_F(LinuxPeerDirectoryTest, NobodyIsNotFoundByTheZeroToken) {
  const auto peer = unconfined({"enter", "once"});
  const auto nobody = identify(peer);
  EXPECT_FALSE(directory_.find(QXAuditToken{}));
}

// The same on kernels that lack one thing or another.
class OlderKernel : public PeerTest, public ::testing::WithParamInterface<KernelFacilities> {};

TEST_P(OlderKernel, StillTellsTheConfinedFromTheUnconfinedFromNobody) {
  LinuxPeerDirectory directory(bundles_, house_.log.defaultLog(), GetParam());
  const auto inside = confined(install("org.a"));
  const auto outside = unconfined();
  const auto between = unconfined({"enter", "once"});
  auto gone = unconfined();
  ASSERT_EQ(::kill(gone.process.pid(), SIGKILL), 0);
  EXPECT_EQ(gone.process.status(), 128 + SIGKILL);

  const auto insideIdentity = directory.identify(inside.connection.get());
  const auto outsideIdentity = directory.identify(outside.connection.get());
  EXPECT_EQ(insideIdentity->bundleIdentifier, "org.a");
  EXPECT_EQ(insideIdentity->standing, Standing::confined);
  EXPECT_EQ(outsideIdentity->standing, Standing::unconfined);
  EXPECT_NE(insideIdentity->token, outsideIdentity->token);
  EXPECT_EQ(directory.identify(outside.connection.get())->token, outsideIdentity->token);
  EXPECT_EQ(directory.identify(between.connection.get())->standing, Standing::nobody);
  EXPECT_EQ(directory.identify(gone.connection.get())->standing, Standing::nobody);
}

std::vector<KernelFacilities> olderKernels() {
  std::vector<KernelFacilities> kernels;
  const auto present = KernelFacilities::probe();
  for (int missing = 1; missing < 8; ++missing) {
    KernelFacilities kernel = present;
    if ((missing & 1) != 0) kernel.peerPidfd = false;
    if ((missing & 2) != 0) kernel.pidfdNamespaces = false;
    if ((missing & 4) != 0) kernel.uniquePidfdInodes = false;
    kernels.push_back(kernel);
  }
  return kernels;
}

std::string kernelName(const ::testing::TestParamInfo<KernelFacilities>& info) { return ::testing::PrintToString(info.param); }

INSTANTIATE_TEST_SUITE_P(Kernels, OlderKernel, ::testing::ValuesIn(olderKernels()), kernelName);

}  // namespace
}  // namespace docuvend::linux_platform
