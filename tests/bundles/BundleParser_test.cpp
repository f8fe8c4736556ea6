#include "platform/linux/bundles/BundleParser.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <cerrno>

#include "platform/linux/bundles/OpenInBundle.h"
#include "tests/bundles/BundleHouse.h"
#include "tests/bundles/InterposedLooks.h"

namespace docuvend::linux_platform {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class BundleParser : public ::testing::Test {
 protected:
  [[nodiscard]] ParsedBundle parse() {
    auto result = parseBundle(directory_, house_.propertyLists);
    if (const auto* problem = std::get_if<BundleProblem>(&result)) ADD_FAILURE() << problem->text;
    return std::holds_alternative<ParsedBundle>(result) ? std::get<ParsedBundle>(std::move(result)) : ParsedBundle{};
  }
  [[nodiscard]] std::string problem() {
    const auto result = parseBundle(directory_, house_.propertyLists);
    const auto* problem = std::get_if<BundleProblem>(&result);
    return problem != nullptr ? problem->text : "";
  }
  void writeInfo(const std::string& entries) { BundleHouse::write(directory_ + "/Info.plist", BundleHouse::propertyList(entries)); }
  [[nodiscard]] std::string infoProblem(const std::string& entries) {
    writeInfo(entries);
    return problem();
  }

  BundleHouse house_;
  InterposedLooks looks_;
  const std::string directory_ = house_.root() + "/bundle";
};

TEST_F(BundleParser, ReadsWhatInfoPlistSays) {
  BundleHouse::install(directory_, "org.a",
                       BundleHouse::entry("QXGroups", BundleHouse::array({"org.a.one", "org.b.two"})) +
                           BundleHouse::entry("QXGroupMembers", "<dict><key>org.a.one</key>" + BundleHouse::array({"org.c"}) + "</dict>") +
                           BundleHouse::entry("QXExtension", "<dict><key>QXExtensionPointName</key><string>point</string></dict>"));
  const auto parsed = parse();
  EXPECT_EQ(parsed.bundle.identifier, "org.a");
  EXPECT_EQ(parsed.bundle.directory, directory_);
  EXPECT_EQ(parsed.bundle.executable, directory_ + "/program");
  EXPECT_THAT(parsed.wantedGroups, ElementsAre("org.a.one", "org.b.two"));
  ASSERT_EQ(parsed.groupMembers.size(), 1U);
  EXPECT_THAT(parsed.groupMembers.at("org.a.one"), ElementsAre("org.c"));
  EXPECT_NE(qxFind<QXDictionary>(parsed.bundle.info, "QXExtension"), nullptr);
  EXPECT_TRUE(parsed.bundle.entitlements.empty());
}

TEST_F(BundleParser, ReadsEntitlementsBesideInfoPlist) {
  BundleHouse::install(directory_, "org.a");
  BundleHouse::write(directory_ + "/Entitlements.plist", BundleHouse::propertyList("<key>org.right</key><true/>"));
  const auto parsed = parse();
  const auto* right = qxFind<bool>(parsed.bundle.entitlements, "org.right");
  ASSERT_NE(right, nullptr);
  EXPECT_TRUE(*right);
}

TEST_F(BundleParser, LeavesAnExtensionEntryOfAnotherKindToWhoReadsIt) {
  BundleHouse::install(directory_, "org.a", BundleHouse::entry("QXExtension", BundleHouse::text("none")));
  EXPECT_NE(qxFind<std::string>(parse().bundle.info, "QXExtension"), nullptr);
}

TEST_F(BundleParser, NeedsADirectoryWithInfoPlist) {
  EXPECT_THAT(problem(), HasSubstr("cannot be opened"));
  BundleHouse::writeExecutable(directory_ + "/program", "");
  EXPECT_EQ(problem(), "has no Info.plist");
  std::filesystem::create_directory(directory_ + "/Info.plist");
  EXPECT_EQ(problem(), "Info.plist is not a regular file");
}

TEST_F(BundleParser, RefusesInfoPlistThatIsNone) {
  BundleHouse::install(directory_, "org.a");
  BundleHouse::write(directory_ + "/Info.plist", "not a list");
  EXPECT_THAT(problem(), HasSubstr("Info.plist is no property list"));
  BundleHouse::write(directory_ + "/Info.plist", "<?xml version=\"1.0\"?><plist version=\"1.0\"><string>x</string></plist>");
  EXPECT_EQ(problem(), "Info.plist holds no dictionary");
}

TEST_F(BundleParser, RefusesEntitlementsThatAreNone) {
  BundleHouse::install(directory_, "org.a");
  BundleHouse::write(directory_ + "/Entitlements.plist", "<plist");
  EXPECT_THAT(problem(), HasSubstr("Entitlements.plist is no property list"));
}

TEST_F(BundleParser, RefusesPropertyListsThatAreLinks) {
  BundleHouse::install(directory_, "org.a");
  BundleHouse::write(house_.root() + "/else.plist", BundleHouse::propertyList(""));
  std::filesystem::create_symlink(house_.root() + "/else.plist", directory_ + "/Entitlements.plist");
  EXPECT_EQ(problem(), "Entitlements.plist is not a regular file");
}

TEST_F(BundleParser, RefusesEntriesOfTheWrongKind) {
  BundleHouse::install(directory_, "org.a");
  const std::string identifier = BundleHouse::entry("QXBundleIdentifier", BundleHouse::text("org.a"));
  const std::string executable = BundleHouse::entry("QXBundleExecutable", BundleHouse::text("program"));
  struct Case {
    std::string entries;
    std::string expected;
  };
  for (const auto& [entries, expected] : std::vector<Case>{
           {executable, "Info.plist has no string QXBundleIdentifier"},
           {executable + BundleHouse::entry("QXBundleIdentifier", "<integer>1</integer>"), "Info.plist has no string QXBundleIdentifier"},
           {executable + BundleHouse::entry("QXBundleIdentifier", BundleHouse::text("../a")), "its identifier is malformed"},
           {executable + BundleHouse::entry("QXBundleIdentifier", BundleHouse::text("com")),
            "its identifier has a single part and needs two or more, like org.name"},
           {identifier + executable +
                BundleHouse::entry("QXGroupMembers", "<dict><key>../org.b.one</key>" + BundleHouse::array({"org.c"}) + "</dict>"),
            "QXGroupMembers has a malformed name"},
           {identifier, "Info.plist has no string QXBundleExecutable"},
           {identifier + BundleHouse::entry("QXBundleExecutable", "<true/>"), "Info.plist has no string QXBundleExecutable"},
           {identifier + BundleHouse::entry("QXBundleExecutable", BundleHouse::text("")), "Info.plist has no string QXBundleExecutable"},
           {identifier + executable + BundleHouse::entry("QXGroups", BundleHouse::text("a")), "QXGroups is not made of arrays of strings"},
           {identifier + executable + BundleHouse::entry("QXGroups", "<array><true/></array>"),
            "QXGroups is not made of arrays of strings"},
           {identifier + executable + BundleHouse::entry("QXGroups", BundleHouse::array({"../x"})), "QXGroups has a malformed name"},
           {identifier + executable + BundleHouse::entry("QXGroupMembers", BundleHouse::array({})), "QXGroupMembers is not a dictionary"},
           {identifier + executable + BundleHouse::entry("QXGroupMembers", "<dict><key>g</key><string>x</string></dict>"),
            "QXGroupMembers is not made of arrays of strings"},
       }) {
    EXPECT_EQ(infoProblem(entries), expected) << entries;
  }
}

TEST_F(BundleParser, RefusesAnExecutableThatIsNotItsOwn) {
  BundleHouse::install(directory_, "org.a");
  BundleHouse::writeExecutable(house_.root() + "/other", "#!/bin/sh\n");
  BundleHouse::write(directory_ + "/plain", "");
  std::filesystem::create_directory(directory_ + "/sub");
  std::filesystem::create_symlink("program", directory_ + "/link");
  std::filesystem::create_symlink(".", directory_ + "/loop");
  ASSERT_EQ(::mkfifo((directory_ + "/pipe").c_str(), 0755), 0);
  const std::string identifier = BundleHouse::entry("QXBundleIdentifier", BundleHouse::text("org.a"));
  struct Case {
    std::string executable;
    std::string expected;
  };
  for (const auto& [executable, expected] : std::vector<Case>{
           {"../other", "its executable lies outside the bundle"},
           {"sub/../../other", "its executable lies outside the bundle"},
           {"/bin/sh", "its executable lies outside the bundle"},
           {"missing", "its executable cannot be opened"},
           {"plain", "its executable may not be executed"},
           {"sub", "its executable is not a regular file"},
           {"pipe", "its executable is not a regular file"},
           {"link", "its executable is a link, or lies behind one"},
           {"loop/program", "its executable is a link, or lies behind one"},
       }) {
    EXPECT_THAT(infoProblem(identifier + BundleHouse::entry("QXBundleExecutable", BundleHouse::text(executable))), HasSubstr(expected))
        << executable;
  }
}

TEST_F(BundleParser, TheWayToTheExecutableIsTheShortest) {
  BundleHouse::install(directory_, "org.a");
  std::filesystem::create_directory(directory_ + "/sub");
  BundleHouse::write(directory_ + "/Info.plist",
                     BundleHouse::propertyList(BundleHouse::entry("QXBundleIdentifier", BundleHouse::text("org.a")) +
                                               BundleHouse::entry("QXBundleExecutable", BundleHouse::text("sub/.././program"))));
  std::vector<std::string> ways;
  looks_.failWith([&ways](const InterposedLooks::Call& call) {
    if (call.name == "openat2") ways.push_back(call.path);
    return 0;
  });
  EXPECT_EQ(parse().bundle.executable, directory_ + "/program");
  EXPECT_THAT(ways, ElementsAre("program"));
}

TEST_F(BundleParser, ARenameElsewhereSaysNothingOfTheExecutable) {
  BundleHouse::install(directory_, "org.a");
  int walks = 0;
  int lost = kMostWalks - 1;
  looks_.failWith([&walks, &lost](const InterposedLooks::Call& call) { return call.name == "openat2" && ++walks <= lost ? EAGAIN : 0; });
  EXPECT_EQ(parse().bundle.executable, directory_ + "/program");
  EXPECT_EQ(walks, kMostWalks);

  walks = 0;
  lost = kMostWalks;
  const auto unseen = parseBundle(directory_, house_.propertyLists);
  ASSERT_TRUE(std::holds_alternative<QXError>(unseen));
  EXPECT_EQ(std::get<QXError>(unseen), notSeen(directory_ + "/program", EAGAIN));
  EXPECT_EQ(walks, kMostWalks);
}

TEST_F(BundleParser, GivesAnotherVersionAfterEachChange) {
  BundleHouse::install(directory_, "org.a");
  const auto first = parse().bundle.version;
  EXPECT_EQ(parse().bundle.version, first);

  BundleHouse::install(directory_ + "-new", "org.a");
  std::filesystem::rename(directory_, directory_ + "-old");
  std::filesystem::rename(directory_ + "-new", directory_);
  const auto second = parse().bundle.version;
  EXPECT_NE(second, first);

  BundleHouse::write(directory_ + "/Entitlements.plist", BundleHouse::propertyList(""));
  EXPECT_NE(parse().bundle.version, second);
}

TEST_F(BundleParser, TellsItsDirectoryFromOthersOfItsNameWhateverChangesInIt) {
  BundleHouse::install(directory_, "org.a");
  const auto first = parse().bundle.incarnation;
  struct statx status {};
  ASSERT_EQ(::statx(AT_FDCWD, directory_.c_str(), 0, STATX_INO | STATX_BTIME, &status), 0);
  EXPECT_EQ(first, std::to_string(::makedev(status.stx_dev_major, status.stx_dev_minor)) + "." + std::to_string(status.stx_ino) + "." +
                       std::to_string(status.stx_btime.tv_sec) + "." + std::to_string(status.stx_btime.tv_nsec));

  BundleHouse::write(directory_ + "/Entitlements.plist", BundleHouse::propertyList(""));
  BundleHouse::write(directory_ + "/new-file", "");
  std::filesystem::rename(directory_, directory_ + "-elsewhere");
  std::filesystem::rename(directory_ + "-elsewhere", directory_);
  EXPECT_EQ(parse().bundle.incarnation, first);

  std::filesystem::rename(directory_, directory_ + "-old");
  BundleHouse::install(directory_, "org.a");
  EXPECT_NE(parse().bundle.incarnation, first);
}

}  // namespace
}  // namespace docuvend::linux_platform
