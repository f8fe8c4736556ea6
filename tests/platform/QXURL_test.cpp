#include "platform/QXURL.h"

#include <gtest/gtest.h>

#include <string>
#include <string_view>

namespace docuvend {
namespace {

TEST(QXURL, AcceptsTheThreeSpellingsOfAnAuthority) {
  for (const char* text : {"file:/a/b.txt", "file:///a/b.txt", "file://localhost/a/b.txt"}) {
    const auto url = QXURL::fromString(text);
    ASSERT_TRUE(url) << text;
    EXPECT_EQ(url->absoluteString(), "file:///a/b.txt") << text;
    EXPECT_EQ(url->fileSystemPath(), "/a/b.txt") << text;
  }
}

TEST(QXURL, RefusesWhatIsNoFileURL) {
  for (const std::string_view text : {"",
                                      "/a",
                                      "file:",
                                      "file://",
                                      "file:a",
                                      "file://host/a",
                                      "http:///a",
                                      "FILE:///a",
                                      "file:///a b",
                                      "file:///a?q",
                                      "file:///a#f",
                                      "file:///%",
                                      "file:///%4",
                                      "file:///%zz",
                                      "file:///%00",
                                      "file:///%ff",
                                      "file:///%c0%80",
                                      "file:///%ed%a0%80",
                                      "file:///\xc3\xa9",
                                      "file:///a\n"}) {
    EXPECT_FALSE(QXURL::fromString(text)) << text;
  }
}

TEST(QXURL, KeepsItsTextAndDecodesItsPath) {
  const auto url = QXURL::fromString("file:///a//b%20c/%E2%82%AC.txt");
  ASSERT_TRUE(url);
  EXPECT_EQ(url->absoluteString(), "file:///a//b%20c/%E2%82%AC.txt");
  EXPECT_EQ(url->fileSystemPath(), "/a//b c/€.txt");
}

TEST(QXURL, MakesAURLFromAnyPathAndReadsItBack) {
  const std::string path = "/ü/a%b?c#d\x01/e";
  const QXURL url = QXURL::fileURL(path, QXURLKind::file);
  EXPECT_EQ(url.fileSystemPath(), path);
  EXPECT_EQ(QXURL::fromString(url.absoluteString()), url);
}

TEST(QXURL, ADirectoryEndsInASlashThatItsPathDoesNotHave) {
  const QXURL url = QXURL::fileURL("/a/b", QXURLKind::directory);
  EXPECT_EQ(url.absoluteString(), "file:///a/b/");
  EXPECT_TRUE(url.hasDirectoryPath());
  EXPECT_EQ(url.fileSystemPath(), "/a/b");
  EXPECT_EQ(QXURL::fileURL("/", QXURLKind::directory).fileSystemPath(), "/");
}

TEST(QXURL, AppendsAComponentEscaped) {
  const QXURL url = QXURL::fileURL("/a", QXURLKind::file);
  EXPECT_EQ(url.appendingPathComponent("b c/d", QXURLKind::directory).absoluteString(), "file:///a/b%20c%2Fd/");
}

}  // namespace
}  // namespace docuvend
