// Passing a document on: who may, as the kernel sees it.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <iterator>
#include <string>
#include <vector>

#include "common/DVErrors.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;

// Applications without any entitlement.
constexpr const char* kAuthor = "com.example.author";
constexpr const char* kFriend = "com.example.friend";
constexpr const char* kNotPermitted = "DVErrorDomain 2";

class BookmarkGrants : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
    house_.installTrickster();
    for (const char* bundle : {kAuthor, kFriend}) {
      house_.install(bundle, "docuvend-asker", stringEntry("QXBundleIdentifier", bundle), {});
    }
    letter_ = url(house_.putInCloud("letter.txt", "Dear all\n"));
    (void)house_.putInCloud("other.txt", "Another one\n");
    house_.startDaemon();
  }

  static QXURL url(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }
  // The lines of a launch.
  std::vector<std::string> say(const std::string& bundle, const std::vector<std::string>& words) const {
    const Ending ended = house_.confined(bundle, words);
    EXPECT_EQ(ended.status, 0) << ended.errors;
    std::vector<std::string> lines;
    std::string::size_type from = 0;
    for (auto end = ended.output.find('\n'); end != std::string::npos; from = end + 1, end = ended.output.find('\n', from)) {
      lines.push_back(ended.output.substr(from, end - from));
    }
    return lines;
  }
  [[nodiscard]] std::string refusalLine(const QXURL& item, const std::string& caller, const std::string& consumer,
                                        const QXError& error) const {
    return "[ERROR] Could not extend bookmark privileges for URL " + item.absoluteString() + " from bundle " + caller + " to consumer ID " +
           consumer + ", error: " + error.description();
  }
  std::optional<QXError> extend(const std::optional<std::string>& caller, const std::optional<QXURL>& item,
                                const std::optional<ConsumerID>& consumer) const {
    return errorOf(house_.client(caller)->ask<&DVDaemon::extendBookmarkForFileURL>(item, consumer));
  }

  QXURL letter_ = QXURL::fileURL("/", QXURLKind::directory);
};

// --- Confined applications, none of which holds an entitlement

TEST_F(BookmarkGrants, OneThatHasRedeemedAWriteTokenPassesTheDocumentOn) {
  const std::string string = house_.granted(letter_.fileSystemPath(), kAuthor);
  EXPECT_THAT(say(kAuthor, {"write", string, "extend", letter_.absoluteString(), kFriend}), ElementsAre("ok", string));
  EXPECT_THAT(house_.accessControl(), HasSubstr(std::string("<key>").append(kFriend)));
  EXPECT_THAT(say(kFriend, {"read", string}), ElementsAre("ok"));

  const std::vector<std::string> expected = {
      "[DEBUG] Extending bookmark privileges for URL: “" + letter_.absoluteString() +
          "” from bundle com.example.author to com.example.friend.",
      "[INFO] Allowing provider ID com.orvane.cellar to provide item ID “" + string.substr(string.find('/') + 1) +
          "” to consumer ID com.example.friend",
      "[INFO] Committing access control list",
      "[DEBUG] Successfully generated bookmarkable string “" + string + "” from URL " + letter_.absoluteString() + "."};
  const auto log = house_.log();
  auto from = log.begin();
  for (const std::string& line : expected) {
    const auto found = std::find(from, log.end(), line);
    ASSERT_NE(found, log.end()) << "not in its place: " << line;
    from = std::next(found);
  }
}

TEST_F(BookmarkGrants, WhoWasPassedADocumentMayPassItOn) {
  const std::string string = house_.granted(letter_.fileSystemPath(), kAuthor);
  ASSERT_THAT(say(kAuthor, {"write", string, "extend", letter_.absoluteString(), kFriend}), ElementsAre("ok", string));
  EXPECT_THAT(say(kFriend, {"write", string, "extend", letter_.absoluteString(), kEditor}), ElementsAre("ok", string));
}

TEST_F(BookmarkGrants, OneThatHasRedeemedForReadingDoesNotPass) {
  const std::string string = house_.granted(letter_.fileSystemPath(), kAuthor);
  EXPECT_THAT(say(kAuthor, {"read", string, "extend", letter_.absoluteString(), kFriend}), ElementsAre("ok", kNotPermitted));
  EXPECT_EQ(house_.logged(refusalLine(letter_, kAuthor, kFriend, DVNotPermittedError())), 1);
  EXPECT_THAT(house_.accessControl(), Not(HasSubstr(kFriend)));
}

TEST_F(BookmarkGrants, AGrantAloneDoesNotSufficeNorWhatAnEarlierLaunchRedeemed) {
  const std::string string = house_.granted(letter_.fileSystemPath(), kAuthor);
  EXPECT_THAT(say(kAuthor, {"extend", letter_.absoluteString(), kFriend}), ElementsAre(kNotPermitted));
  ASSERT_THAT(say(kAuthor, {"write", string}), ElementsAre("ok"));
  EXPECT_THAT(say(kAuthor, {"extend", letter_.absoluteString(), kFriend}), ElementsAre(kNotPermitted));
}

TEST_F(BookmarkGrants, WhatWasRedeemedForOneDocumentDoesNotCountForAnother) {
  const QXURL other = url(house_.document("other.txt"));
  const std::string string = house_.granted(letter_.fileSystemPath(), kAuthor);
  EXPECT_THAT(say(kAuthor, {"write", string, "extend", other.absoluteString(), kFriend}), ElementsAre("ok", kNotPermitted));
}

TEST_F(BookmarkGrants, OneThatBuiltTheSamePathInItsOwnDirectoriesDoesNotPass) {
  // In its own view the path is there, and it may write it: another file under the same name.
  EXPECT_THAT(say(kAuthor, {"make", letter_.fileSystemPath(), "extend", letter_.absoluteString(), kFriend}),
              ElementsAre("ok", kNotPermitted));
  EXPECT_EQ(house_.logged(refusalLine(letter_, kAuthor, kFriend, DVNotPermittedError())), 1);
  EXPECT_EQ(house_.accessControl(), "");
}

TEST_F(BookmarkGrants, OneWhosePathLeadsIntoItsOwnContainerDoesNotPass) {
  const std::string own = house_.container(kAuthor) + "/own.txt";
  EXPECT_THAT(say(kAuthor, {"make", own, "link", letter_.fileSystemPath(), own, "extend", letter_.absoluteString(), kFriend}),
              ElementsAre("ok", "ok", kNotPermitted));
  EXPECT_EQ(house_.accessControl(), "");
}

TEST_F(BookmarkGrants, AFileOfItsOwnBelongsToNoProvider) {
  const QXURL own = url(house_.container(kAuthor) + "/own.txt");
  const auto answers = say(kAuthor, {"make", own.fileSystemPath(), "extend", own.absoluteString(), kFriend});
  EXPECT_THAT(answers, ElementsAre("ok", "DVErrorDomain 6"));
  EXPECT_EQ(house_.logged(refusalLine(own, kAuthor, kFriend, DVNotFoundErrorURL(own))), 1);
}

// --- Others

TEST_F(BookmarkGrants, AnUnconfinedClientPassesAsTheBundleThatItDeclares) {
  EXPECT_EQ(extend(kAuthor, letter_, ConsumerID{kFriend}), std::nullopt);
  EXPECT_THAT(house_.accessControl(), HasSubstr(kFriend));
}

TEST_F(BookmarkGrants, AnUnconfinedClientThatDeclaresNoneIsUnknown) {
  EXPECT_EQ(extend(std::nullopt, letter_, ConsumerID{kFriend}), DVNotPermittedError());
  EXPECT_EQ(house_.logged("[DEBUG] Extending bookmark privileges for URL: “" + letter_.absoluteString() +
                          "” from bundle (null) to com.example.friend."),
            1);
  EXPECT_EQ(house_.logged(refusalLine(letter_, "(null)", kFriend, DVNotPermittedError())), 1);
  EXPECT_EQ(house_.accessControl(), "");
}

TEST_F(BookmarkGrants, MissingArgumentsAreNotPermitted) {
  EXPECT_EQ(extend(kAuthor, letter_, std::nullopt), DVNotPermittedError());
  EXPECT_EQ(extend(kAuthor, std::nullopt, ConsumerID{kFriend}), DVNotPermittedError());
  EXPECT_EQ(extend(std::nullopt, std::nullopt, std::nullopt), DVNotPermittedError());
}

TEST_F(BookmarkGrants, AFileOfTheSystemIsNotPermittedAndOneOfTheUsersOwnIsNotFound) {
  EXPECT_EQ(extend(kAuthor, url("/etc/passwd"), ConsumerID{kFriend}), DVNotPermittedError());
  const QXURL own = url(house_.home() + "/own.txt");
  writeFile(own.fileSystemPath(), "");
  EXPECT_EQ(extend(kAuthor, own, ConsumerID{kFriend}), DVNotFoundErrorURL(own));
}

TEST_F(BookmarkGrants, TheStorageItselfIsNotFound) {
  const QXURL storage = QXURL::fileURL(house_.storage(kCellar), QXURLKind::directory);
  EXPECT_EQ(extend(kAuthor, storage, ConsumerID{kFriend}), DVNotFoundErrorURL(storage));
}

TEST_F(BookmarkGrants, AProviderThatCannotNameTheItemFailsTheRequest) {
  const QXURL item = url(house_.storage(kTrickster) + "/refused");
  writeFile(item.fileSystemPath(), "");
  EXPECT_EQ(extend(kAuthor, item, ConsumerID{kFriend}),
            DVPluginOperationFailedError(DVPluginOperationFailedError(QXError::make("TricksterErrorDomain", 1, "No."))));
  EXPECT_EQ(house_.accessControl(), "");
}

TEST_F(BookmarkGrants, AProviderThatAbortsIsAnErrorAndWorksAtTheNextTry) {
  for (const char* name : {"abort", "other"}) writeFile(house_.storage(kTrickster) + "/" + name, "");
  const auto error = extend(kAuthor, url(house_.storage(kTrickster) + "/abort"), ConsumerID{kFriend});
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, static_cast<std::int64_t>(DVErrorCode::pluginOperationFailed));
  EXPECT_EQ(house_.accessControl(), "");
  EXPECT_EQ(extend(kAuthor, url(house_.storage(kTrickster) + "/other"), ConsumerID{kFriend}), std::nullopt);
}

}  // namespace
}  // namespace docuvend::tests
