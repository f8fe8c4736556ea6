// Bundles that are none, or claim to be another, beside good ones.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "common/DVErrors.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

const std::string kRegistered = "[INFO] Registered docuvend extension com.orvane.cellar for path ";

class Bundles : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    house_.install(kCellar);
    house_.install(kEditor);
    house_.install(kPicker);
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
  }

  std::string makeBroken(const std::string& name, const std::string& info) const {
    const std::string directory = house_.bundles() + "/" + name;
    fs::create_directory(directory);
    writeFile(directory + "/Info.plist", info);
    return directory;
  }
  void expectTheWayIsOpen() const {
    const std::string string = house_.granted(letter_, kEditor);
    const Ending shown = house_.confined(kEditor, {"show", string});
    EXPECT_EQ(shown.output, "Dear all\n") << shown.errors;
  }

  std::string letter_;
};

TEST_F(Bundles, AnInfoFileThatIsNoPropertyListIsToldAndTheOthersAreServed) {
  const std::vector<std::string> broken = {
      makeBroken("a.empty", ""),
      makeBroken("a.text", "not a property list"),
      makeBroken("a.half", propertyList("<key>QXBundleIdentifier</key>")),
      makeBroken("a.entity", "<?xml version=\"1.0\"?><!DOCTYPE plist [<!ENTITY a \"aaaa\">]><plist version=\"1.0\"><dict/></plist>"),
      makeBroken("a.array", "<?xml version=\"1.0\"?><plist version=\"1.0\"><array/></plist>"),
      makeBroken("a.nameless", propertyList("")),
      makeBroken("a.escaping", propertyList(stringEntry("QXBundleIdentifier", "a.escaping") +
                                            stringEntry("QXBundleExecutable", "../com.orvane.cellar/cellar"))),
      makeBroken("a.malformed", propertyList(stringEntry("QXBundleIdentifier", "../a") + stringEntry("QXBundleExecutable", "x"))),
  };
  fs::create_directory(house_.bundles() + "/a.without");
  fs::create_directory_symlink(house_.bundles() + "/com.orvane.editor", house_.bundles() + "/a.link");
  house_.startDaemon();
  for (const std::string& directory : broken) {
    EXPECT_EQ(house_.loggedBeginning("[ERROR] Ignoring the bundle at " + directory + ": "), 1) << directory;
  }
  EXPECT_EQ(house_.logged("[ERROR] Ignoring the bundle at " + house_.bundles() + "/a.without: has no Info.plist."), 1);
  EXPECT_EQ(house_.logged("[ERROR] Ignoring the bundle at " + house_.bundles() + "/a.link: it is a link."), 1);
  EXPECT_EQ(house_.loggedBeginning(kRegistered), 1);
  expectTheWayIsOpen();
}

TEST_F(Bundles, ABundleWithAnothersIdentifierIsIgnored) {
  const std::string forged = house_.bundles() + "/zz.forged";
  house_.install("zz.forged", "docuvendctl", stringEntry("QXBundleIdentifier", kPicker), trueEntry("com.orvane.docuvend.acl-write"));
  house_.startDaemon();
  EXPECT_EQ(
      house_.logged("[ERROR] Ignoring the bundle at " + forged + ": " + house_.bundles() + "/com.orvane.picker has the same identifier."),
      1);
  expectTheWayIsOpen();
}

TEST_F(Bundles, ABundleDoesNotGetAGroupOfAnother) {
  house_.install("com.example.thief", "docuvendctl",
                 stringEntry("QXBundleIdentifier", "com.example.thief") +
                     "<key>QXGroups</key><array><string>com.orvane.cellar.documents</string></array>",
                 {});
  house_.startDaemon();
  EXPECT_EQ(
      house_.logged(
          "[ERROR] The bundle com.example.thief may not belong to the group com.orvane.cellar.documents, which is com.orvane.cellar's."),
      1);
  expectTheWayIsOpen();
}

TEST_F(Bundles, AnApplicationThatIsInstalledLaterIsServedWithoutARestart) {
  house_.startDaemon();
  house_.install(kStranger);
  eventually("the stranger is known", [this] { return house_.confined(kStranger, {"providers"}).status == 0; });
}

TEST_F(Bundles, AProviderThatIsInstalledLaterIsRegisteredAndTheOldOneIsKept) {
  house_.startDaemon();
  house_.installTrickster();
  ASSERT_TRUE(house_.awaitLog("[INFO] Registered docuvend extension com.orvane.trickster for path "));
  EXPECT_EQ(house_.loggedBeginning(kRegistered), 1);
  expectTheWayIsOpen();
}

TEST_F(Bundles, AProviderThatIsRemovedIsNoLongerFound) {
  house_.installTrickster();
  house_.startDaemon();
  fs::remove_all(house_.bundles() + "/" + kTrickster);
  const auto caller = house_.client(kPicker);
  eventually("the provider is gone", [&caller, this] {
    return errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(QXURL::fileURL(letter_, QXURLKind::file), ProviderID{kTrickster},
                                                                   ConsumerID{kEditor})) == DVNotFoundError(ProviderID{kTrickster});
  });
  expectTheWayIsOpen();
}

TEST_F(Bundles, WhatABundleLeavesIsToldOfWhenItCannotBeWritten) {
  house_.startDaemon();
  const std::string directory = house_.runtime() + "/docuvend";
  fs::permissions(directory, fs::perms::owner_read | fs::perms::owner_exec);
  fs::remove_all(house_.bundles() + "/" + kCellar);
  const std::string line = "[ERROR] The tokens for a container that a bundle has left may be good again after a restart: ";
  EXPECT_TRUE(house_.awaitLog(line));
  fs::permissions(directory, fs::perms::owner_all);
  EXPECT_EQ(house_.logged(line + "QXSystemErrorDomain 13: cannot create a temporary file beside " + directory +
                          "/token-floors: Permission denied"),
            1);
}

}  // namespace
}  // namespace docuvend::tests
