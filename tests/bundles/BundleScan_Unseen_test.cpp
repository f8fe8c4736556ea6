// What becomes of bundles that cannot be looked at.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

#include "platform/linux/bundles/BundleScan.h"
#include "tests/bundles/BundleHouse.h"
#include "tests/bundles/InterposedLooks.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Pair;
using ::testing::SizeIs;
using ::testing::UnorderedElementsAre;

constexpr int kMostCalls = 1000;  // of one look

class UnseenBundlesTest : public ::testing::Test {
 protected:
  [[nodiscard]] std::string system(const std::string& name) const { return house_.paths.systemBundles + "/" + name; }
  [[nodiscard]] std::string user(const std::string& name) const { return house_.paths.userBundles + "/" + name; }
  static fake_platform::FakeLogEntry fault(const std::string& text) { return {QXLogType::fault, text}; }
  static QXError notSeenFor(int error, const std::string& place) { return QXError::system(error, "cannot look at " + place); }

  // One of each kind: the system's, one with a program deeper in it, with entitlements, a group's owner and its member; behind a linked
  // home.
  void furnish() {
    fs::create_directories(house_.root() + "/real/containers");
    fs::create_directory_symlink(house_.root() + "/real", house_.root() + "/alias");
    house_.paths.userBundles = house_.root() + "/alias/bundles";
    house_.paths.containers = house_.root() + "/alias/containers";
    house_.paths.groupContainers = house_.root() + "/alias/groups";
    BundleHouse::install(system("s"), "org.s");
    BundleHouse::install(
        user("owner"), "org.owner",
        BundleHouse::entry("QXGroups", BundleHouse::array({"org.owner.g"})) +
            BundleHouse::entry("QXGroupMembers", "<dict><key>org.owner.g</key>" + BundleHouse::array({"org.member"}) + "</dict>"));
    BundleHouse::install(user("member"), "org.member", BundleHouse::entry("QXGroups", BundleHouse::array({"org.owner.g"})));
    BundleHouse::write(user("deep") + "/Info.plist",
                       BundleHouse::propertyList(BundleHouse::entry("QXBundleIdentifier", BundleHouse::text("org.deep")) +
                                                 BundleHouse::entry("QXBundleExecutable", BundleHouse::text("bin/program"))));
    BundleHouse::write(user("deep") + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
    BundleHouse::writeExecutable(user("deep") + "/bin/program", "#!/bin/sh\n");
  }

  static std::vector<std::string> describe(const BundleMap& bundles) {
    std::vector<std::string> result;
    for (const auto& [identifier, bundle] : bundles) {
      std::string line = identifier;
      for (const std::string& part : {bundle.directory, bundle.executable, bundle.container, bundle.version, bundle.incarnation}) {
        line.append(" ").append(part);
      }
      for (const auto& [group, container] : bundle.groups) line.append(" ").append(group).append("=").append(container);
      for (const auto& [right, value] : bundle.entitlements) line.append(" ").append(right);
      result.push_back(line);
    }
    return result;
  }

  BundleHouse house_;
  InterposedLooks looks_;
};

struct Failing {
  int error;
  enum class Lasts { once, on } lasts;
};

class UnseenBundlesWhenCallsFail : public UnseenBundlesTest, public ::testing::WithParamInterface<Failing> {
 protected:
  // From this call on, or only it.
  void failCall(int first) {
    calls_ = 0;
    failed_.clear();
    looks_.failWith([this, first](const InterposedLooks::Call& call) {
      const int number = calls_++;
      if (number < first || (number > first && GetParam().lasts == Failing::Lasts::once)) return 0;
      if (failed_.empty()) failed_ = call.name + " " + call.path;
      return GetParam().error;
    });
  }

  int calls_ = 0;
  std::string failed_;  // the first call that did
};

TEST_P(UnseenBundlesWhenCallsFail, WhatWasKnownStays) {
  furnish();
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  const auto known = describe(scan.run().bundles);
  ASSERT_EQ(known.size(), 4U);
  for (int first = 0;; ++first) {
    ASSERT_LT(first, kMostCalls);
    failCall(first);
    const auto look = scan.run();
    looks_.failWith({});
    if (failed_.empty()) break;
    EXPECT_EQ(describe(look.bundles), known) << failed_;
    EXPECT_TRUE(look.notSeen) << failed_;
    const auto next = scan.run();
    EXPECT_EQ(describe(next.bundles), known) << failed_;
    EXPECT_FALSE(next.notSeen);
  }
  EXPECT_GT(calls_, 40);
  EXPECT_THAT(house_.log.texts(), IsEmpty()) << "nothing is wrong with any bundle";
}

TEST_P(UnseenBundlesWhenCallsFail, TheFirstLookIsMadeUpForByTheNext) {
  furnish();
  const auto all = describe(house_.scan());
  for (int first = 0;; ++first) {
    ASSERT_LT(first, kMostCalls);
    BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
    failCall(first);
    const auto look = scan.run();
    looks_.failWith({});
    if (failed_.empty()) break;
    EXPECT_TRUE(look.notSeen) << failed_;
    const auto next = scan.run();
    EXPECT_EQ(describe(next.bundles), all) << failed_;
    EXPECT_FALSE(next.notSeen);
  }
  for (const auto& text : house_.log.texts()) EXPECT_THAT(text, ::testing::StartsWith("[ERROR] The bundle org.member may not belong to"));
}

INSTANTIATE_TEST_SUITE_P(Errors, UnseenBundlesWhenCallsFail,
                         ::testing::Values(Failing{EMFILE, Failing::Lasts::once}, Failing{EMFILE, Failing::Lasts::on},
                                           Failing{ENFILE, Failing::Lasts::on}, Failing{ENOMEM, Failing::Lasts::once},
                                           Failing{ENOMEM, Failing::Lasts::on}, Failing{EIO, Failing::Lasts::once},
                                           Failing{EIO, Failing::Lasts::on}),
                         [](const auto& tested) {
                           return std::string(strerrorname_np(tested.param.error)) +
                                  (tested.param.lasts == Failing::Lasts::once ? "Once" : "FromThenOn");
                         });

TEST_F(UnseenBundlesTest, ADirectoryThatCannotBeListedKeepsWhatIsStillThereOfIt) {
  for (const std::string name : {"stays", "goes", "replaced", "open"}) BundleHouse::install(user(name), "org." + name);
  BundleHouse::install(system("s"), "org.s");
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  ASSERT_THAT(scan.run().bundles, SizeIs(5));
  fs::remove_all(user("goes"));
  fs::rename(user("replaced"), house_.root() + "/aside");
  BundleHouse::install(user("replaced"), "org.replaced");
  fs::permissions(user("open"), fs::perms::others_write, fs::perm_options::add);
  BundleHouse::install(user("new"), "org.new");
  BundleHouse::install(system("new"), "org.sn");
  looks_.failAt("opendir", house_.paths.userBundles, EMFILE);
  const auto look = scan.run();
  EXPECT_THAT(look.bundles,
              UnorderedElementsAre(Pair("org.stays", ::testing::_), Pair("org.s", ::testing::_), Pair("org.sn", ::testing::_)));
  EXPECT_EQ(look.notSeen, notSeenFor(EMFILE, house_.paths.userBundles));
  EXPECT_THAT(house_.log.entries(),
              ElementsAre(fault("[ERROR] Ignoring the bundle at " + user("open") + ": it can be written by others.")));
  looks_.failWith({});
  const auto next = scan.run();
  EXPECT_THAT(next.bundles, SizeIs(5)) << "stays, replaced, new and the system's two";
  EXPECT_FALSE(next.notSeen);
}

TEST_F(UnseenBundlesTest, ABundleThatCannotBeLookedAtHarmsNoOther) {
  BundleHouse::install(user("a"), "org.a");
  BundleHouse::install(user("b"), "org.b");
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  const auto before = scan.run().bundles;
  for (const std::string name : {"a", "b"}) {
    BundleHouse::write(user(name) + "/Entitlements.plist", BundleHouse::propertyList("<key>right</key><true/>"));
  }
  looks_.failAt("open", user("a") + "/Entitlements.plist", EMFILE);
  auto look = scan.run();
  EXPECT_EQ(look.notSeen, notSeenFor(EMFILE, user("a") + "/Entitlements.plist"));
  EXPECT_EQ(look.bundles.at("org.a").version, before.at("org.a").version);
  EXPECT_THAT(look.bundles.at("org.a").entitlements, IsEmpty());
  EXPECT_THAT(look.bundles.at("org.b").entitlements, SizeIs(1));
  looks_.failWith({});
  look = scan.run();
  EXPECT_FALSE(look.notSeen);
  EXPECT_THAT(look.bundles.at("org.a").entitlements, SizeIs(1));
  EXPECT_THAT(house_.log.texts(), IsEmpty());
}

TEST_F(UnseenBundlesTest, WhatIsClosedToThisUserIsNoBundleThoughItWasOne) {
  BundleHouse::install(user("a"), "org.a");
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  ASSERT_THAT(scan.run().bundles, SizeIs(1));
  const std::string line = "[ERROR] Ignoring the bundle at " + user("a") + ": Info.plist cannot be opened.";
  // A lease is of that kind: a bundle's own process may take one.
  for (const int error : {EACCES, EPERM, EAGAIN}) {
    looks_.failWith([error](const InterposedLooks::Call& call) {
      return (call.name == "open" || call.name == "openat") && call.path.ends_with("Info.plist") ? error : 0;
    });
    house_.log.clear();
    const auto look = scan.run();
    EXPECT_THAT(look.bundles, IsEmpty()) << error;
    EXPECT_FALSE(look.notSeen);
    EXPECT_THAT(house_.log.entries(), ElementsAre(fault(line)));
    looks_.failWith({});
    ASSERT_THAT(scan.run().bundles, SizeIs(1));
  }
  looks_.failAt("opendir", house_.paths.userBundles, EACCES);
  const auto look = scan.run();
  EXPECT_THAT(look.bundles, IsEmpty());
  EXPECT_FALSE(look.notSeen);
}

TEST_F(UnseenBundlesTest, ANewBundleWaitsWhileOneOfTheSystemsMayComeBeforeIt) {
  BundleHouse::install(system("one"), "org.one");
  BundleHouse::install(user("one"), "org.one");
  for (const std::string& unseen : {house_.paths.systemBundles, system("one") + "/Info.plist"}) {
    BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
    looks_.failAt(unseen == house_.paths.systemBundles ? "opendir" : "open", unseen, EMFILE);
    EXPECT_THAT(scan.run().bundles, IsEmpty()) << unseen;
    looks_.failWith({});
    EXPECT_EQ(scan.run().bundles.at("org.one").directory, system("one"));
  }
}

// The call that does not see the first of two bundles with one identifier. Empty directory: at the directory of bundles.
struct Unseen {
  BundleOrigin origin;
  std::string call;
  std::string directory;
};

class UnseenFirstOfTwo : public UnseenBundlesTest, public ::testing::WithParamInterface<Unseen> {
 protected:
  void SetUp() override {
    BundleHouse::install(first_, "org.x");
    BundleHouse::install(user("second"), "org.x");
    ASSERT_EQ(scan_.run().bundles.at("org.x").directory, first_);
    fs::rename(first_, house_.root() + "/aside");
  }
  void expectNobody() {
    looks_.failAt(GetParam().call, root_ + GetParam().directory, EMFILE);
    for (int look = 0; look < 2; ++look) {
      const auto seen = scan_.run();
      EXPECT_TRUE(seen.notSeen);
      EXPECT_THAT(seen.bundles, IsEmpty());
    }
    looks_.failWith({});
  }

  const std::string root_ = GetParam().origin == BundleOrigin::system ? house_.paths.systemBundles : house_.paths.userBundles;
  const std::string first_ = root_ + "/first";
  BundleScan scan_{house_.paths, house_.propertyLists, house_.log.defaultLog()};
};

TEST_P(UnseenFirstOfTwo, WhenItIsReplacedIsFollowedByNobody) {
  BundleHouse::install(first_, "org.x");
  expectNobody();
  EXPECT_EQ(scan_.run({first_}).bundles.at("org.x").directory, first_) << "what is not settled counts as what it was";
  EXPECT_EQ(scan_.run().bundles.at("org.x").directory, first_);
}

TEST_P(UnseenFirstOfTwo, WhenItIsGoneIsFollowedByTheSecondOnceNothingBeforeThatIsMissed) {
  if (!GetParam().directory.empty()) BundleHouse::install(root_ + GetParam().directory, "org.y");
  expectNobody();
  EXPECT_EQ(scan_.run().bundles.at("org.x").directory, user("second"));
}

INSTANTIATE_TEST_SUITE_P(Places, UnseenFirstOfTwo,
                         ::testing::Values(Unseen{BundleOrigin::system, "realpath", ""}, Unseen{BundleOrigin::system, "opendir", ""},
                                           Unseen{BundleOrigin::system, "open", "/first"}, Unseen{BundleOrigin::user, "realpath", ""},
                                           Unseen{BundleOrigin::user, "opendir", ""}, Unseen{BundleOrigin::user, "open", "/first"}),
                         [](const auto& tested) {
                           return tested.param.call + (tested.param.origin == BundleOrigin::system ? "OfTheSystems" : "OfTheUsers");
                         });

TEST_F(UnseenBundlesTest, TheFirstLookFindsOnlyWhatComesBeforeWhatItMisses) {
  for (const std::string name : {"a", "b", "c"}) BundleHouse::install(user(name), "org." + name);
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  looks_.failAt("open", user("b"), EMFILE);
  for (int look = 0; look < 2; ++look) EXPECT_THAT(scan.run().bundles, ElementsAre(Pair("org.a", ::testing::_)));
  looks_.failWith({});
  EXPECT_THAT(scan.run().bundles, SizeIs(3));
}

TEST_F(UnseenBundlesTest, AnIdentifierStaysWithItsDirectoryWhileWhatComesBeforeIsMissed) {
  BundleHouse::install(user("b"), "org.b");
  BundleHouse::install(user("c"), "org.c");
  BundleHouse::install(user("d"), "org.d");
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  ASSERT_THAT(scan.run().bundles, SizeIs(3));
  BundleHouse::install(user("a"), "org.b");
  fs::rename(user("c"), house_.root() + "/aside");
  BundleHouse::install(user("c"), "org.c");
  fs::rename(user("d"), user("e"));
  looks_.failAt("opendir", house_.paths.systemBundles, EMFILE);
  for (int look = 0; look < 2; ++look) {
    const auto bundles = scan.run().bundles;
    EXPECT_THAT(bundles, ElementsAre(Pair("org.b", ::testing::_))) << "another is in the place of org.c's, and org.d's in another";
    EXPECT_EQ(bundles.at("org.b").directory, user("b"));
  }
  EXPECT_THAT(house_.log.texts(), IsEmpty());
  looks_.failWith({});
  const auto bundles = scan.run().bundles;
  EXPECT_THAT(bundles, SizeIs(3));
  EXPECT_EQ(bundles.at("org.b").directory, user("a"));
}

TEST_F(UnseenBundlesTest, AKnownBundleOfTheUsersIsUpdatedWhileTheSystemsCannotBeLookedAtUnlessItIsAnothersNow) {
  BundleHouse::install(user("a"), "org.a");
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  const std::string version = scan.run().bundles.at("org.a").version;
  looks_.failAt("opendir", house_.paths.systemBundles, EMFILE);
  BundleHouse::write(user("a") + "/Entitlements.plist", BundleHouse::propertyList(""));
  EXPECT_NE(scan.run().bundles.at("org.a").version, version);
  BundleHouse::install(user("a"), "org.other");
  EXPECT_THAT(scan.run().bundles, IsEmpty());
  looks_.failWith({});
  EXPECT_THAT(scan.run().bundles, ElementsAre(Pair("org.other", ::testing::_)));
}

TEST_F(UnseenBundlesTest, WhatIsWrongIsNotSaidAgainBecauseItWasNotSeenMeanwhile) {
  fs::create_directories(user("bad"));
  BundleScan scan(house_.paths, house_.propertyLists, house_.log.defaultLog());
  (void)scan.run();
  looks_.failAt("opendir", house_.paths.userBundles, EMFILE);
  EXPECT_TRUE(scan.run().notSeen);
  looks_.failWith({});
  EXPECT_FALSE(scan.run().notSeen);
  EXPECT_THAT(house_.log.entries(), ElementsAre(fault("[ERROR] Ignoring the bundle at " + user("bad") + ": has no Info.plist.")));
}

TEST_F(UnseenBundlesTest, TheDirectoriesToWatchAreNotThoseThatCouldBeListed) {
  fs::create_directories(user("a") + "/x/y");
  looks_.failAt("opendir", user("a") + "/x", EMFILE);
  EXPECT_EQ(std::get<QXError>(directoriesOfBundle(user("a"))), notSeenFor(EMFILE, user("a") + "/x"));
  for (const std::string call : {"opendir", "realpath"}) {
    looks_.failAt(call, house_.paths.userBundles, EMFILE);
    EXPECT_EQ(std::get<QXError>(bundleDirectories(house_.paths.userBundles)), notSeenFor(EMFILE, house_.paths.userBundles));
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
