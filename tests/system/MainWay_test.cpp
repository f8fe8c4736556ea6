// One document's way from its provider to a confined application and back.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>

#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

class MainWay : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
    letter_ = house_.putInCloud("letter.txt", kText);
    house_.startDaemon();
  }

  static long blocksOf(const std::string& path) {
    struct stat status {};
    return ::stat(path.c_str(), &status) == 0 ? status.st_blocks : -1;
  }

  static inline const std::string kText = std::string(60'000, 'x') + "\nDear all\n";
  std::string letter_;
};

TEST_F(MainWay, TheProviderIsListedWithItsStorage) {
  const Ending providers = house_.confined(kPicker, {"providers"});
  EXPECT_EQ(providers.status, 0) << providers.errors;
  EXPECT_EQ(providers.output, kCellar + "\t" + QXURL::fileURL(house_.storage(kCellar), QXURLKind::directory).absoluteString() + "\n");
  EXPECT_EQ(house_.logged("[INFO] Registered docuvend extension com.orvane.cellar for path " +
                          QXURL::fileURL(house_.storage(kCellar), QXURLKind::directory).absoluteString()),
            1);
}

TEST_F(MainWay, TheGrantedDocumentIsMaterialisedAndRead) {
  EXPECT_EQ(blocksOf(letter_), 0);
  const std::string string = house_.granted(letter_, kEditor);
  EXPECT_THAT(string, StartsWith("docuvend:com.orvane.cellar/"));
  EXPECT_EQ(blocksOf(letter_), 0);
  const Ending shown = house_.confined(kEditor, {"show", string});
  EXPECT_EQ(shown.status, 0) << shown.errors;
  EXPECT_EQ(shown.output, kText);
  EXPECT_GT(blocksOf(letter_), 0);
}

TEST_F(MainWay, AnAtomicSaveReachesTheCloud) {
  const std::string string = house_.granted(letter_, kEditor);
  const Ending saved = house_.confined(kEditor, {"append", string, "Yours"});
  ASSERT_EQ(saved.status, 0) << saved.errors;
  EXPECT_EQ(contentsOf(letter_), kText + "Yours\n");
  EXPECT_FALSE(std::filesystem::exists(house_.document(".letter.txt")));
  eventually("the cloud has the change", [this] { return contentsOf(house_.cloudFile("letter.txt")) == kText + "Yours\n"; });
}

TEST_F(MainWay, TheConfinedApplicationCannotOpenTheDocumentByItsPath) {
  (void)house_.granted(letter_, kEditor);
  const Ending opened = house_.confined(kEditor, {"open", letter_});
  EXPECT_EQ(opened.status, 1);
  EXPECT_EQ(opened.output, "");
  EXPECT_THAT(opened.errors, HasSubstr("No such file or directory"));
}

TEST_F(MainWay, AGrantIsRecordedThenTokensAreIssuedThenItIsAnswered) {
  const std::string string = house_.granted(letter_, kEditor);
  const std::string item = string.substr(string.find('/') + 1);
  const std::string url = QXURL::fileURL(letter_, QXURLKind::file).absoluteString();
  const std::vector<std::string> expected = {
      "[DEBUG] Serving: extendSandboxForFileURL:fromProviderID:toConsumerID:completionHandler:",
      "[DEBUG] -[DVExtensionDocuvend itemIDForURL:completionHandler:]",
      "[DEBUG] Beginning extension request.",
      "[DEBUG] Successfully got item ID “" + item + "” for URL " + url + " from extension com.orvane.cellar",
      "[INFO] Allowing provider ID com.orvane.cellar to provide item ID “" + item + "” to consumer ID com.orvane.editor",
      "[INFO] Committing access control list",
      "[INFO] Resolved URL to provider com.orvane.cellar.",
      "[INFO] Successfully extended sandbox for URL " + url + " from provider ID com.orvane.cellar to consumer ID com.orvane.editor.",
      "[DEBUG] Getting bookmarkable string for URL " + url,
      "[DEBUG] Successfully generated bookmarkable string “" + string + "” from URL " + url + ".",
  };
  const auto log = house_.log();
  auto from = log.begin();
  for (const std::string& line : expected) {
    const auto found = std::find(from, log.end(), line);
    ASSERT_NE(found, log.end()) << "not in its place: " << line;
    from = std::next(found);
  }
}

TEST_F(MainWay, GrantingTwiceIsSaidAndLeavesTheFileUntouched) {
  const std::string string = house_.granted(letter_, kEditor);
  const std::string item = string.substr(string.find('/') + 1);
  struct stat before {};
  ASSERT_EQ(::stat(house_.accessControlFile().c_str(), &before), 0);
  EXPECT_EQ(house_.granted(letter_, kEditor), string);
  struct stat after {};
  ASSERT_EQ(::stat(house_.accessControlFile().c_str(), &after), 0);
  EXPECT_EQ(before.st_ino, after.st_ino);
  EXPECT_EQ(house_.logged("[INFO] Committing access control list"), 1);
  EXPECT_EQ(house_.logged("[INFO] Provider ID com.orvane.cellar is already allowed to provide item ID “" + item +
                          "” to consumer ID com.orvane.editor."),
            1);
}

TEST_F(MainWay, ResolvingAStringIsLoggedInItsOwnWords) {
  const std::string string = house_.granted(letter_, kEditor);
  const std::string item = string.substr(string.find('/') + 1);
  const std::string url = QXURL::fileURL(letter_, QXURLKind::file).absoluteString();
  const Ending shown = house_.confined(kEditor, {"show", string});
  ASSERT_EQ(shown.status, 0) << shown.errors;
  EXPECT_EQ(house_.logged("[DEBUG] Getting URL from bookmarkable string: “" + string + "”."), 1);
  EXPECT_EQ(house_.logged("[DEBUG] Successfully retrieved URL " + url + " for item ID “" + item + "” from extension com.orvane.cellar"), 1);
  EXPECT_EQ(house_.logged("[INFO] Successfully extended sandbox of URL " + url +
                          " from provider ID com.orvane.cellar to consumer ID com.orvane.editor."),
            1);
  EXPECT_EQ(house_.logged("[DEBUG] Serving: startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:"), 1);
  EXPECT_EQ(house_.logged("[DEBUG] Successfully provided item at URL " + url + " for extension com.orvane.cellar."), 1);
}

TEST_F(MainWay, TheProviderRenamesADocumentAndItsStringStillFindsIt) {
  const std::string string = house_.granted(letter_, kEditor);
  ASSERT_EQ(::rename(letter_.c_str(), house_.document("note.txt").c_str()), 0);
  const Ending shown = house_.confined(kEditor, {"show", string});
  EXPECT_EQ(shown.output, kText) << shown.errors;
  EXPECT_EQ(house_.bookmark(house_.document("note.txt")), string);
}

}  // namespace
}  // namespace docuvend::tests
