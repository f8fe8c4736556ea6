// The log is read by people at terminals, and by programs line by line. Nothing that a peer says begins a line of it, ends one, or reaches
// the terminal as anything but characters.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>

#include "platform/linux/extension_host/OutputLines.h"
#include "platform/linux/extension_host/OutputLog.h"
#include "platform/linux/wire/ConnectToSocket.h"
#include "tests/attacks/AttackTest.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::tests {
namespace {

using linux_platform::OutputLines;
using linux_platform::OutputLog;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

// A line of the daemon's own, with the journal's form of a field before it, and what moves a terminal's cursor.
const std::string kMessage = "[NOTICE] PID 1 declares itself to be com.orvane.picker.";
const std::string kForgery = "x\nPRIORITY=0\n_UID=0\ndocuvendd[1]: " + kMessage + "\r\x1b[2J\x1b]0;t\x07\x7f\u0085\u2028\u202e";
// The same of what XML can carry, as item identifiers must.
const std::string kItemForgery = "x\nPRIORITY=0\ndocuvendd[1]: " + kMessage + "\r\u2028\u202e";

class ForgedLines : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    installAttacker(trueEntry("com.orvane.docuvend.acl-write") + trueEntry("com.orvane.docuvend.acl-read"));
    house_.install(kEditor);
    house_.installTrickster();
    house_.startDaemon();
  }

  // Something was logged that has the forged message in it, in `times` lines, and in none of them is it more than text.
  void expectToldAsText(int times = 1) const {
    EXPECT_GE(house_.loggedContaining(kMessage), times) << "the honest part: it is told";
    EXPECT_EQ(house_.logged(kMessage), 0);
    for (const std::string& line : house_.log()) {
      EXPECT_FALSE(line.starts_with("PRIORITY=") || line.starts_with("_UID=") || line.starts_with("docuvendd[")) << line;
      EXPECT_TRUE(std::none_of(line.begin(), line.end(), [](unsigned char c) { return c < 0x20 || c == 0x7f; })) << line;
      for (const char* harmful : {"\u0085", "\u2028", "\u202e"}) EXPECT_EQ(line.find(harmful), std::string::npos) << line;
    }
  }
  [[nodiscard]] QXURL item(const std::string& name) const {
    return QXURL::fileURL(house_.storage(kTrickster) + "/" + name, QXURLKind::file);
  }
};

TEST_F(ForgedLines, AURLsNameIsText) {
  ASSERT_EQ(errorOf(house_.client(kAttacker)->ask<&DVDaemon::extendSandboxForFileURL>(item("honest"), ProviderID{kTrickster},
                                                                                      ConsumerID{kEditor})),
            std::nullopt);
  EXPECT_GE(house_.loggedContaining(item("honest").absoluteString()), 1);
  (void)house_.client(kAttacker)->ask<&DVDaemon::extendSandboxForFileURL>(item(kItemForgery), ProviderID{kTrickster}, ConsumerID{kEditor});
  (void)house_.client(kAttacker)->ask<&DVDaemon::startProvidingItemAtURL>(item(kItemForgery), ProviderID{kTrickster}, ConsumerID{"none"});
  (void)house_.client()->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(QXURL::fileURL("/etc/" + kItemForgery, QXURLKind::file));
  expectToldAsText();
}

TEST_F(ForgedLines, AProvidersItemIdentifierIsText) {
  const auto granted =
      house_.client(kAttacker)->ask<&DVDaemon::extendSandboxForFileURL>(item(kItemForgery), ProviderID{kTrickster}, ConsumerID{kAttacker});
  EXPECT_EQ(errorOf(granted), std::nullopt) << "the identifier is unusual, and no more";
  (void)house_.client(kEditor)->ask<&DVDaemon::documentURLFromBookmarkableString>("docuvend:" + kTrickster + "/" + kItemForgery);
  expectToldAsText();
}

TEST_F(ForgedLines, TheIdentifiersOfAProviderAndAConsumerAreText) {
  (void)house_.client(kAttacker)->ask<&DVDaemon::extendSandboxForFileURL>(item("a"), ProviderID{kItemForgery}, ConsumerID{kItemForgery});
  (void)house_.client(kAttacker)->ask<&DVDaemon::startProvidingItemAtURL>(item("a"), ProviderID{kItemForgery}, ConsumerID{kItemForgery});
  (void)house_.client(kEditor)->ask<&DVDaemon::documentURLFromBookmarkableString>("docuvend:" + kItemForgery + "/" + kItemForgery);
  expectToldAsText(2);
}

TEST_F(ForgedLines, ABundleThatIsNotInstalledIsNotToldOfWhenACallerDeclaresIt) {
  EXPECT_NE(house_.client(kItemForgery)->ask<&DVDaemon::wakeUpCompletion>().index(), 0U);
  EXPECT_EQ(house_.client(kEditor)->ask<&DVDaemon::wakeUpCompletion>().index(), 0U);
  EXPECT_EQ(house_.loggedContaining(" declares itself to be com.orvane.editor."), 1);
  EXPECT_EQ(house_.loggedContaining(kMessage), 0);
}

TEST_F(ForgedLines, AProvidersErrorIsText) {
  writeFile(house_.container(kTrickster) + "/says", kItemForgery);
  const auto refused =
      house_.client(kAttacker)->ask<&DVDaemon::extendSandboxForFileURL>(item("refused"), ProviderID{kTrickster}, ConsumerID{kEditor});
  ASSERT_TRUE(errorOf(refused));
  expectToldAsText();
}

TEST_F(ForgedLines, WhatAnExtensionPrintsComesUnderItsNameLineByLine) {
  // Each of its lines is told of as its own; none is told as the daemon's.
  writeFile(house_.container(kTrickster) + "/prints", kForgery + "\n");
  ASSERT_EQ(errorOf(house_.client(kAttacker)->ask<&DVDaemon::extendSandboxForFileURL>(item("prints"), ProviderID{kTrickster},
                                                                                      ConsumerID{kEditor})),
            std::nullopt);
  ASSERT_TRUE(house_.awaitLog("[INFO] com.orvane.trickster: docuvendd[1]: " + kMessage));
  EXPECT_EQ(house_.logged("[INFO] com.orvane.trickster: PRIORITY=0"), 1);
  EXPECT_EQ(house_.logged("[INFO] com.orvane.trickster: _UID=0"), 1);
  expectToldAsText();
}

TEST_F(ForgedLines, AnExtensionThatPrintsWithoutEndFillsNoLog) {
  constexpr int kPrinted = 20'000;
  std::string prints = std::string(3 * OutputLines::kLongestLine, 'w') + "\n";
  for (int i = 0; i < kPrinted; ++i) prints += "flood\n";
  writeFile(house_.container(kTrickster) + "/prints", prints);
  const auto began = std::chrono::steady_clock::now();
  ASSERT_EQ(errorOf(house_.client(kAttacker)->ask<&DVDaemon::extendSandboxForFileURL>(item("prints"), ProviderID{kTrickster},
                                                                                      ConsumerID{kEditor})),
            std::nullopt);
  // Whoever reads the log learns what is missing, at the latest when the extension has ended.
  (void)house_.client(kAttacker)->ask<&DVDaemon::extendSandboxForFileURL>(item("leave"), ProviderID{kTrickster}, ConsumerID{kEditor});
  ASSERT_TRUE(house_.awaitLog(" lines more than are logged."));
  const auto back = (std::chrono::steady_clock::now() - began) / OutputLog::kTimeForALine + 1;
  const int told = house_.loggedContaining("[INFO] com.orvane.trickster: flood");
  EXPECT_GT(told, 0);
  EXPECT_LE(told, static_cast<int>(OutputLog::kLinesAtOnce) + back);
  EXPECT_EQ(house_.logged("[INFO] com.orvane.trickster: " + std::string(OutputLines::kLongestLine, 'w')), 1);
  EXPECT_EQ(house_.loggedContaining(std::string(OutputLines::kLongestLine + 1, 'w')), 0);
}

TEST_F(ForgedLines, ABundlesFileThatCannotBeReadIsToldOfInText) {
  house_.install(kItemForgery.substr(0, kItemForgery.find('\r')), "docuvend-attacker", stringEntry("QXBundleIdentifier", "../\u202ex"), {});
  ASSERT_TRUE(house_.awaitLog("Ignoring the bundle at "));
  expectToldAsText();
}

}  // namespace
}  // namespace docuvend::tests
