#include "service/DVBookmarkableString.h"

#include <gtest/gtest.h>

#include <vector>

namespace docuvend {
namespace {

DVBookmarkableString bookmark(const char* provider, const char* item) { return {ProviderID{provider}, ItemID{item}}; }

TEST(DVBookmarkableString, IsThePrefixTheProviderASlashAndTheItem) {
  EXPECT_EQ(bookmark("com.orvane.cellar", "42").text(), "docuvend:com.orvane.cellar/42");
  EXPECT_EQ(bookmark("p", "A/B").text(), "docuvend:p/A/B");
}

TEST(DVBookmarkableString, IsEqualToOneOfTheSameProviderAndItem) {
  EXPECT_TRUE(bookmark("p", "i") == bookmark("p", "i"));
  EXPECT_FALSE(bookmark("p", "i") == bookmark("q", "i"));
  EXPECT_FALSE(bookmark("p", "i") == bookmark("p", "j"));
}

TEST(DVBookmarkableString, EscapesNothing) { EXPECT_EQ(bookmark("p ", "a%2F ü:/").text(), "docuvend:p /a%2F ü:/"); }

TEST(DVBookmarkableString, ReadsWhatHasPrefixProviderAndItem) {
  struct Case {
    const char* text;
    const char* provider;
    const char* item;
  };
  for (const Case& good : std::vector<Case>{{"docuvend:p/i", "p", "i"},
                                            {"docuvend:p/i/", "p", "i/"},
                                            {"docuvend:p/A/B", "p", "A/B"},
                                            {"docuvend:p/a//b", "p", "a//b"},
                                            {"docuvend:p/a//", "p", "a//"},
                                            {"docuvend:docuvend:/i", "docuvend:", "i"},
                                            {"docuvend: / ", " ", " "},
                                            {"docuvend:p%2F/i%2F", "p%2F", "i%2F"}}) {
    const auto parsed = DVBookmarkableString::parse(good.text);
    ASSERT_TRUE(parsed) << good.text;
    EXPECT_EQ(*parsed, bookmark(good.provider, good.item)) << good.text;
    EXPECT_EQ(parsed->text(), good.text);
  }
}

TEST(DVBookmarkableString, RefusesEverythingElse) {
  for (const char* bad :
       {"", "docuvend", "docuvend:", "docuvend:/", "docuvend://", "docuvend:p", "docuvend:p/", "docuvend:/i", "docuvend:p//a",
        "docuvend:p//", "Docuvend:p/i", "DOCUVEND:p/i", " docuvend:p/i", "xdocuvend:p/i", "p/i", "docuvend;p/i"}) {
    EXPECT_FALSE(DVBookmarkableString::parse(bad)) << bad;
  }
}

TEST(DVBookmarkableString, AnItemWithSlashesReadsBack) {
  for (const char* item : {"a", "a/b", "a/", "a//b/", "ü/%"}) {
    const auto original = bookmark("com.orvane.cellar", item);
    EXPECT_EQ(DVBookmarkableString::parse(original.text()), original) << item;
  }
}

}  // namespace
}  // namespace docuvend
