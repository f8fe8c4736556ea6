#include "acl/DVGrantTree.h"

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

namespace docuvend {
namespace {

const ProviderID kCellar{"com.orvane.cellar"};
const ProviderID kAttic{"com.orvane.attic"};
const ConsumerID kEditor{"com.example.editor"};
const ConsumerID kPicker{"com.example.picker"};

QXDictionary consumerWith(QXArray items) { return {{"AllowedItemIDs", std::move(items)}}; }

DVGrantTree treeOf(QXDictionary dictionary) {
  auto tree = DVGrantTree::fromPropertyList(std::move(dictionary));
  EXPECT_TRUE(std::holds_alternative<DVGrantTree>(tree));
  return std::get<DVGrantTree>(std::move(tree));
}

TEST(DVGrantTree, IsEmptyAtFirst) {
  EXPECT_EQ(DVGrantTree().dictionary(), QXDictionary());
  EXPECT_FALSE(DVGrantTree().allows(kCellar, ItemID{"1"}, kEditor));
}

TEST(DVGrantTree, AGrantIsTheTripleAndNothingLess) {
  DVGrantTree tree;
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_TRUE(tree.allows(kCellar, ItemID{"1"}, kEditor));
  EXPECT_FALSE(tree.allows(kAttic, ItemID{"1"}, kEditor));
  EXPECT_FALSE(tree.allows(kCellar, ItemID{"2"}, kEditor));
  EXPECT_FALSE(tree.allows(kCellar, ItemID{"1"}, kPicker));
}

TEST(DVGrantTree, ComparesIdentifiersAsExactStrings) {
  DVGrantTree tree;
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"Item"}, kEditor));
  for (const char* item : {"item", "Item ", "Ite", "Item\n", ""}) EXPECT_FALSE(tree.allows(kCellar, ItemID{item}, kEditor)) << item;
  EXPECT_FALSE(tree.allows(ProviderID{"com.orvane.Cellar"}, ItemID{"Item"}, kEditor));
  EXPECT_FALSE(tree.allows(kCellar, ItemID{"Item"}, ConsumerID{"com.example"}));
}

TEST(DVGrantTree, KeepsItemsInTheOrderOfTheirGrants) {
  DVGrantTree tree;
  for (const char* item : {"z", "a", "m"}) EXPECT_TRUE(tree.allow(kCellar, ItemID{item}, kEditor));
  EXPECT_EQ(tree.dictionary(), (QXDictionary{{kCellar.value, QXDictionary{{kEditor.value, consumerWith({"z", "a", "m"})}}}}));
}

TEST(DVGrantTree, ListsItsGrantsByProviderAndConsumerAndItemsInTheOrderOfTheirGrants) {
  DVGrantTree tree;
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"z"}, kPicker));
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"z"}, kEditor));
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"a"}, kEditor));
  EXPECT_TRUE(tree.allow(kAttic, ItemID{"m"}, kPicker));
  EXPECT_EQ(tree.grants(), (std::vector<DVGrant>{{kAttic, kPicker, ItemID{"m"}},
                                                 {kCellar, kEditor, ItemID{"z"}},
                                                 {kCellar, kEditor, ItemID{"a"}},
                                                 {kCellar, kPicker, ItemID{"z"}}}));
}

TEST(DVGrantTree, ListsNothingForWhatHoldsNoGrant) {
  EXPECT_TRUE(DVGrantTree().grants().empty());
  const DVGrantTree tree =
      treeOf({{kAttic.value, QXDictionary()},
              {kCellar.value, QXDictionary{{kEditor.value, QXDictionary{{"Further", "key"}}}, {kPicker.value, consumerWith({})}}}});
  EXPECT_TRUE(tree.grants().empty());
}

TEST(DVGrantTree, ListsTheGrantsThatFollowWhatHoldsNone) {
  const DVGrantTree tree = treeOf({{kAttic.value, QXDictionary{{kEditor.value, QXDictionary()}, {kPicker.value, consumerWith({"1"})}}},
                                   {kCellar.value, QXDictionary{{kEditor.value, consumerWith({"2"})}}}});
  EXPECT_EQ(tree.grants(), (std::vector<DVGrant>{{kAttic, kPicker, ItemID{"1"}}, {kCellar, kEditor, ItemID{"2"}}}));
}

TEST(DVGrantTree, GrantingTwiceChangesNothing) {
  DVGrantTree tree;
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"1"}, kEditor));
  const DVGrantTree before = tree;
  EXPECT_FALSE(tree.allow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_EQ(tree, before);
}

TEST(DVGrantTree, EmptyIdentifiersAreIdentifiers) {
  DVGrantTree tree;
  EXPECT_TRUE(tree.allow(ProviderID{}, ItemID{}, ConsumerID{}));
  EXPECT_TRUE(tree.allows(ProviderID{}, ItemID{}, ConsumerID{}));
  EXPECT_EQ(tree.dictionary(), (QXDictionary{{"", QXDictionary{{"", consumerWith({""})}}}}));
}

TEST(DVGrantTree, RevokingRemovesEveryContainerThatBecomesEmpty) {
  DVGrantTree tree;
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_TRUE(tree.disallow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_EQ(tree, DVGrantTree());
}

TEST(DVGrantTree, RevokingOneOfTwoItemsLeavesTheOther) {
  DVGrantTree tree;
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"2"}, kEditor));
  EXPECT_TRUE(tree.disallow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_EQ(tree.dictionary(), (QXDictionary{{kCellar.value, QXDictionary{{kEditor.value, consumerWith({"2"})}}}}));
}

TEST(DVGrantTree, RevokingOneOfTwoConsumersLeavesTheProvider) {
  DVGrantTree tree;
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"1"}, kPicker));
  EXPECT_TRUE(tree.disallow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_EQ(tree.dictionary(), (QXDictionary{{kCellar.value, QXDictionary{{kPicker.value, consumerWith({"1"})}}}}));
}

TEST(DVGrantTree, RevokingLeavesOtherProvidersAlone) {
  DVGrantTree tree;
  EXPECT_TRUE(tree.allow(kAttic, ItemID{"1"}, kEditor));
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_TRUE(tree.disallow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_EQ(tree.dictionary(), (QXDictionary{{kAttic.value, QXDictionary{{kEditor.value, consumerWith({"1"})}}}}));
}

TEST(DVGrantTree, RevokingWhatIsNotGrantedChangesNothing) {
  DVGrantTree tree;
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"1"}, kEditor));
  const DVGrantTree before = tree;
  EXPECT_FALSE(tree.disallow(kAttic, ItemID{"1"}, kEditor));
  EXPECT_FALSE(tree.disallow(kCellar, ItemID{"2"}, kEditor));
  EXPECT_FALSE(tree.disallow(kCellar, ItemID{"1"}, kPicker));
  EXPECT_EQ(tree, before);
}

TEST(DVGrantTree, RevokingRemovesEveryEqualElement) {
  DVGrantTree tree = treeOf({{kCellar.value, QXDictionary{{kEditor.value, consumerWith({"1", "2", "1"})}}}});
  EXPECT_TRUE(tree.disallow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_EQ(tree.dictionary(), (QXDictionary{{kCellar.value, QXDictionary{{kEditor.value, consumerWith({"2"})}}}}));
}

TEST(DVGrantTree, AConsumerWithAFurtherKeyIsNotEmpty) {
  DVGrantTree tree = treeOf({{kCellar.value, QXDictionary{{kEditor.value, QXDictionary{{"AllowedItemIDs", QXArray{"1"}}, {"Note", 7}}}}}});
  EXPECT_TRUE(tree.disallow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_EQ(tree.dictionary(), (QXDictionary{{kCellar.value, QXDictionary{{kEditor.value, QXDictionary{{"Note", 7}}}}}}));
}

TEST(DVGrantTree, KeepsWhatWasReadAsItWas) {
  const QXDictionary dictionary = {
      {"no consumers", QXDictionary()},
      {"empty below", QXDictionary{{"a", QXDictionary()}, {"b", consumerWith({})}}},
      {"usual", QXDictionary{{"c", consumerWith({"2", "1", "2"})}, {"d", QXDictionary{{"Other", QXArray{true, 1.5}}}}}},
  };
  const DVGrantTree tree = treeOf(dictionary);
  EXPECT_EQ(tree.dictionary(), dictionary);
  EXPECT_FALSE(tree.allows(ProviderID{"no consumers"}, ItemID{"1"}, ConsumerID{"a"}));
  EXPECT_FALSE(tree.allows(ProviderID{"empty below"}, ItemID{"1"}, ConsumerID{"a"}));
  EXPECT_FALSE(tree.allows(ProviderID{"empty below"}, ItemID{"1"}, ConsumerID{"b"}));
  EXPECT_TRUE(tree.allows(ProviderID{"usual"}, ItemID{"1"}, ConsumerID{"c"}));
}

TEST(DVGrantTree, GrantsIntoEmptyContainersThatWereRead) {
  DVGrantTree tree = treeOf({{kCellar.value, QXDictionary{{kEditor.value, QXDictionary()}}}});
  EXPECT_TRUE(tree.allow(kCellar, ItemID{"1"}, kEditor));
  EXPECT_EQ(tree.dictionary(), (QXDictionary{{kCellar.value, QXDictionary{{kEditor.value, consumerWith({"1"})}}}}));
}

TEST(DVGrantTree, TreesAreEqualWhenTheyHoldTheSame) {
  DVGrantTree one;
  DVGrantTree other;
  ASSERT_TRUE(one.allow(ProviderID{"p"}, ItemID{"i"}, ConsumerID{"c"}));
  EXPECT_FALSE(one == other);
  ASSERT_TRUE(other.allow(ProviderID{"p"}, ItemID{"i"}, ConsumerID{"c"}));
  EXPECT_TRUE(one == other);
}

TEST(DVGrantTree, GrantsAreEqualWhenAllThreeIdentifiersAre) {
  const DVGrant grant{ProviderID{"p"}, ConsumerID{"c"}, ItemID{"i"}};
  EXPECT_TRUE(grant == (DVGrant{ProviderID{"p"}, ConsumerID{"c"}, ItemID{"i"}}));
  EXPECT_FALSE(grant == (DVGrant{ProviderID{"q"}, ConsumerID{"c"}, ItemID{"i"}}));
  EXPECT_FALSE(grant == (DVGrant{ProviderID{"p"}, ConsumerID{"d"}, ItemID{"i"}}));
  EXPECT_FALSE(grant == (DVGrant{ProviderID{"p"}, ConsumerID{"c"}, ItemID{"j"}}));
}

TEST(DVGrantTree, RefusesAPropertyListOfAnotherShapeAndSaysWhere) {
  const std::vector<std::pair<QXValue, std::string>> table = {
      {QXArray{}, "the top level is not a dictionary"},
      {"text", "the top level is not a dictionary"},
      {QXDictionary{{"p", "text"}}, "provider p is not a dictionary"},
      {QXDictionary{{"p", QXArray{}}}, "provider p is not a dictionary"},
      {QXDictionary{{"p", QXDictionary{{"c", QXArray{"1"}}}}}, "provider p, consumer c is not a dictionary"},
      {QXDictionary{{"p", QXDictionary{{"c", QXDictionary{{"AllowedItemIDs", "1"}}}}}},
       "provider p, consumer c, AllowedItemIDs is not an array of strings"},
      {QXDictionary{{"p", QXDictionary{{"c", consumerWith({"1", 2})}}}},
       "provider p, consumer c, AllowedItemIDs is not an array of strings"},
      {QXDictionary{{"a", QXDictionary{{"c", consumerWith({"1"})}}}, {"p", 1}}, "provider p is not a dictionary"},
  };
  for (const auto& [value, place] : table) {
    const auto tree = DVGrantTree::fromPropertyList(value);
    const auto* error = std::get_if<QXError>(&tree);
    ASSERT_NE(error, nullptr) << value.description();
    EXPECT_EQ(error->domain, kDVGrantTreeErrorDomain);
    EXPECT_EQ(error->code, kDVGrantTreeMisshapen);
    EXPECT_EQ(error->texts.at("description"), "The access control list is not laid out as one: " + place + ".") << value.description();
  }
}

}  // namespace
}  // namespace docuvend
