#include "examples/cellar/CellarIndex.h"

#include <gtest/gtest.h>

#include <set>
#include <string>
#include <vector>

namespace docuvend::cellar {
namespace {

FileKey key(std::uint64_t inode) { return {inode, static_cast<std::int64_t>(inode) * 10}; }

Entry entry(const std::string& name, std::uint64_t inode) { return {name, {key(inode), 1, 2}}; }

Item item(const std::string& identifier, const std::string& name, std::uint64_t inode) {
  Item result;
  result.identifier = identifier;
  result.local.name = name;
  result.local.key = key(inode);
  return result;
}

struct Case {
  const char* name;
  std::vector<Entry> entries;
  std::string first;   // the name of the file of item 1, which was "a", number 1; empty: none
  std::string second;  // of item 2, which was "b", number 2
  std::size_t unknown;
};

TEST(Recognise, FindsEachItemsFile) {
  const std::vector<Case> cases = {
      {"nothing happened", {entry("a", 1), entry("b", 2)}, "a", "b", 0},
      {"renamed", {entry("b", 2), entry("c", 1)}, "c", "b", 0},
      {"replaced", {entry("a", 7), entry("b", 2)}, "a", "b", 0},
      {"removed", {entry("b", 2)}, "", "b", 0},
      {"a file more", {entry("a", 1), entry("b", 2), entry("c", 3)}, "a", "b", 1},
      {"renamed over the other", {entry("b", 1)}, "b", "", 0},
      {"both renamed", {entry("c", 2), entry("d", 1)}, "d", "c", 0},
      {"renamed in a circle", {entry("a", 2), entry("b", 1)}, "a", "b", 0},
      {"replaced, and its old number given to a new file", {entry("a", 7), entry("b", 2), entry("c", 1)}, "a", "b", 1},
      {"removed, and its number given to a file of the same name", {entry("a", 1), entry("b", 2)}, "a", "b", 0},
      {"all gone", {}, "", "", 0},
  };
  for (const Case& test : cases) {
    std::vector<Item> items = {item("1", "a", 1), item("2", "b", 2)};
    const std::vector<Entry> unknown = recognise(items, &Item::local, test.entries);
    const auto name = [](const Item& one) { return one.local.present ? one.local.name : std::string(); };
    EXPECT_EQ(name(items[0]), test.first) << test.name;
    EXPECT_EQ(name(items[1]), test.second) << test.name;
    EXPECT_EQ(unknown.size(), test.unknown) << test.name;
  }
}

TEST(Recognise, TellsARenameFromAReplacement) {
  std::vector<Item> items = {item("1", "a", 1), item("2", "b", 2)};
  (void)recognise(items, &Item::local, {entry("b", 7), entry("c", 1)});
  EXPECT_TRUE(items[0].local.isRenamed);
  EXPECT_FALSE(items[1].local.isRenamed);
  EXPECT_EQ(items[1].local.key, key(7));
}

TEST(Recognise, AFileOfAnotherBirthIsAnother) {
  std::vector<Item> items = {item("1", "a", 1)};
  Entry reborn = entry("c", 1);
  reborn.fingerprint.key.born += 1;
  EXPECT_EQ(recognise(items, &Item::local, {reborn}).size(), 1U);
  EXPECT_FALSE(items[0].local.present);
}

TEST(Index, ReadsWhatItWrote) {
  Item first = item("0123", "a", 1);
  first.local.fingerprint = {key(1), 18446744073709551615ULL, -5};
  first.cloud.name = "tab\there, line\nthere, 100%, \xC3\xA4\x01";
  first.cloud.key = key(9);
  first.cloud.fingerprint = {key(9), 3, 4};
  const std::vector<Item> items = {first, item("4567", "", 0)};
  const auto read = parseIndex(indexText(items));
  ASSERT_TRUE(read);
  ASSERT_EQ(read->size(), 2U);
  EXPECT_EQ(indexText(*read), indexText(items));
  EXPECT_EQ(read->front().cloud.name, first.cloud.name);
  EXPECT_EQ(read->front().local.fingerprint, first.local.fingerprint);
}

TEST(Item, IsHereUnlessItsFileIsAPlaceholderAndChangedWhenSomebodyHasWrittenIt) {
  Item one = item("1", "a", 1);
  EXPECT_FALSE(one.isHere());
  EXPECT_FALSE(one.isChangedHere());
  one.local.present = one.local.fingerprint = {key(1), 5, 7'000'000'001};
  EXPECT_TRUE(one.isHere());
  EXPECT_FALSE(one.isChangedHere());
  one.local.present->modified += 1;
  EXPECT_TRUE(one.isChangedHere());
  for (const std::int64_t second : {std::int64_t{7'000'000'000}, std::int64_t{0}, std::int64_t{-3'000'000'000}}) {
    one.local.present->modified = second + 314'159'265;
    EXPECT_FALSE(one.isHere()) << second;
    EXPECT_FALSE(one.isChangedHere()) << "whatever the index says of it";
  }
}

TEST(Index, AnEmptyOneIsOne) {
  const auto read = parseIndex(indexText({}));
  ASSERT_TRUE(read);
  EXPECT_TRUE(read->empty());
}

TEST(Index, RefusesWhatIsNone) {
  const std::string good = indexText({item("1", "a", 1)});
  const std::string heading = indexText({});
  const std::vector<std::string> bad = {
      "",
      "cellar index 1\n",
      good.substr(0, good.size() - 1),                            // the last line is cut
      heading + "\n",                                             // an empty line
      heading + "1\ta\n",                                         // fields are missing
      good.substr(0, good.size() - 1) + "\tmore\n",               // a field more
      heading + good.substr(good.find("\ta\t")),                  // no identifier
      heading + "1\ta\tx" + good.substr(good.find("\ta\t") + 4),  // no number
      heading + "1\t%zz" + good.substr(good.find("\ta\t") + 2),   // no escape
      heading + "1\t%4" + good.substr(good.find("\ta\t") + 2),    // half an escape
  };
  ASSERT_TRUE(parseIndex(good));
  for (const std::string& text : bad) EXPECT_FALSE(parseIndex(text)) << text;
}

TEST(Index, IdentifiersDiffer) {
  std::set<std::string> identifiers;
  for (int i = 0; i < 100; ++i) identifiers.insert(newIdentifier());
  EXPECT_EQ(identifiers.size(), 100U);
  EXPECT_EQ(identifiers.begin()->size(), 32U);
}

}  // namespace
}  // namespace docuvend::cellar
