#include "acl/DVGrantLimits.h"

#include <gtest/gtest.h>

#include <string>

#include "platform/linux/files/PropertyListWriter.h"
#include "platform/linux/files/property_list_scalars.h"

namespace docuvend {
namespace {

using linux_platform::propertyListXML;

const ProviderID kCellar{"com.orvane.cellar"};
const ConsumerID kEditor{"com.example.editor"};
const ItemID kItem{"1"};

const DVGranter kEntitled = DVGranter::entitled();
const DVGranter kWriter = DVGranter::writer(ConsumerID{"com.example.writer"});
const DVGranter kOtherWriter = DVGranter::writer(ConsumerID{"com.example.other-writer"});

bool hasRoomFor(const DVGrantTree& tree, const DVGrant& grant) { return DVGrantLimits().hasRoomFor(tree, grant, kEntitled); }
// For a writer who has added nothing.
bool hasRoomForWriter(const DVGrantTree& tree, const DVGrant& grant) { return DVGrantLimits().hasRoomFor(tree, grant, kWriter); }

bool isTaken(DVGrantTree& tree, const DVGrant& grant) {
  return hasRoomFor(tree, grant) && tree.allow(grant.provider, grant.item, grant.consumer);
}

TEST(DVGrantLimits, HalfOfWhatAProviderMayHaveIsKeptAndEightThatTakeAllFitTheFile) {
  constexpr std::size_t kFile = std::size_t{16} << 20U;
  EXPECT_EQ(kDVBytesKeptForEntitled + kDVBytesKeptForEntitled, kDVMaximumBytesOfProvider);
  EXPECT_EQ(kDVConsumersKeptForEntitled + kDVConsumersKeptForEntitled, kDVMaximumConsumersOfItem);
  EXPECT_EQ(8 * kDVMaximumBytesOfProvider, kFile / 2) << "what is edited in by hand has room beside them";
}

TEST(DVGrantLimits, AConsumersIdentifierIsNoLongerThanItsLimit) {
  const std::string longest(kDVLongestGrantedConsumerID, 'c');
  EXPECT_TRUE(hasRoomFor({}, {kCellar, ConsumerID{longest}, kItem}));
  EXPECT_FALSE(hasRoomFor({}, {kCellar, ConsumerID{longest + "c"}, kItem}));
}

TEST(DVGrantLimits, AnItemsIdentifierIsNoLongerThanItsLimit) {
  const std::string longest(kDVLongestGrantedItemID, 'i');
  EXPECT_TRUE(hasRoomFor({}, {kCellar, kEditor, ItemID{longest}}));
  EXPECT_FALSE(hasRoomFor({}, {kCellar, kEditor, ItemID{longest + "i"}}));
}

TEST(DVGrantLimits, WhatTheFileCannotCarryIsNotTaken) {
  for (const std::string& text : {std::string("\x01"), std::string("a\0b", 3), std::string("\xEF\xBF\xBE"), std::string("\xFF")}) {
    EXPECT_FALSE(hasRoomFor({}, {ProviderID{text}, kEditor, kItem}));
    EXPECT_FALSE(hasRoomFor({}, {kCellar, ConsumerID{text}, kItem}));
    EXPECT_FALSE(hasRoomFor({}, {kCellar, kEditor, ItemID{text}}));
  }
  EXPECT_TRUE(hasRoomFor({}, {kCellar, ConsumerID{""}, ItemID{"drafts/Q&A\n<\xE2\x80\xAE>"}}));
}

TEST(DVGrantLimits, AnItemHasNoMoreConsumersThanItsLimit) {
  DVGrantTree tree;
  for (std::size_t i = 0; i < kDVMaximumConsumersOfItem; ++i) {
    EXPECT_TRUE(isTaken(tree, {kCellar, ConsumerID{"com.example." + std::to_string(i)}, kItem})) << i;
  }
  EXPECT_FALSE(hasRoomFor(tree, {kCellar, kEditor, kItem}));
  EXPECT_TRUE(hasRoomFor(tree, {kCellar, kEditor, ItemID{"2"}}));
  EXPECT_TRUE(hasRoomFor(tree, {ProviderID{"com.orvane.attic"}, kEditor, kItem}));
}

TEST(DVGrantLimits, WhoeverMayWriteAnItemLeavesRoomForConsumersThatTheEntitledName) {
  DVGrantTree tree;
  for (std::size_t i = 0; i < kDVMaximumConsumersOfItem - kDVConsumersKeptForEntitled; ++i) {
    const DVGrant grant{kCellar, ConsumerID{"com.example." + std::to_string(i)}, kItem};
    EXPECT_TRUE(hasRoomForWriter(tree, grant)) << i;
    ASSERT_TRUE(tree.allow(grant.provider, grant.item, grant.consumer));
  }
  EXPECT_FALSE(hasRoomForWriter(tree, {kCellar, kEditor, kItem}));
  EXPECT_TRUE(hasRoomFor(tree, {kCellar, kEditor, kItem}));
  EXPECT_TRUE(hasRoomForWriter(tree, {kCellar, kEditor, ItemID{"2"}}));
}

// A tree with its limits, to which writers and the entitled add.
class DVGrantLimitsOfWriters : public ::testing::Test {
 protected:
  [[nodiscard]] bool isAdded(const DVGrant& grant, const DVGranter& granter) {
    if (!limits.hasRoomFor(tree, grant, granter)) return false;
    limits.noteAdded(grant, granter);
    return tree.allow(grant.provider, grant.item, grant.consumer);
  }
  // How many consumers of the item come in until one is refused.
  std::size_t fill(const DVGranter& granter, const ItemID& item = kItem) {
    std::size_t count = 0;
    while (isAdded({kCellar, ConsumerID{"com.example." + std::to_string(++number)}, item}, granter)) ++count;
    return count;
  }

  static constexpr std::size_t kWritersRoom = kDVMaximumConsumersOfItem - kDVConsumersKeptForEntitled;
  DVGrantLimits limits;
  DVGrantTree tree;
  int number = 0;
};

TEST_F(DVGrantLimitsOfWriters, EachLeavesHalfOfTheConsumersThatItFinds) {
  EXPECT_EQ(fill(kWriter), kWritersRoom / 2);
  EXPECT_EQ(fill(kOtherWriter), kWritersRoom / 4);
  EXPECT_EQ(fill(DVGranter::writer(kEditor)), kWritersRoom / 8);
  EXPECT_EQ(fill(kWriter), 0U) << "still";
  EXPECT_EQ(fill(kWriter, ItemID{"2"}), kWritersRoom / 2) << "another item has its own";
  EXPECT_EQ(fill(kEntitled), kDVMaximumConsumersOfItem - kWritersRoom * 7 / 8);
}

TEST_F(DVGrantLimitsOfWriters, ThereIsRoomForWhoeverHasAddedNothingUntilThereIsNoneAtAll) {
  for (std::size_t i = 0; i + 1 < kWritersRoom; ++i) (void)tree.allow(kCellar, kItem, ConsumerID{std::to_string(i)});
  EXPECT_EQ(fill(kWriter), 1U);
  EXPECT_EQ(fill(kOtherWriter), 0U);
}

TEST_F(DVGrantLimitsOfWriters, WhatOthersAndTheEntitledHaveAddedIsNotTheWritersOwn) {
  for (std::size_t i = 0; i < kWritersRoom / 2; ++i) ASSERT_TRUE(isAdded({kCellar, ConsumerID{std::to_string(i)}, kItem}, kEntitled));
  EXPECT_EQ(fill(kWriter), kWritersRoom / 4);
}

TEST_F(DVGrantLimitsOfWriters, WhatHasGoneFromTheTreeCountsNoMore) {
  ASSERT_EQ(fill(kWriter), kWritersRoom / 2);
  ASSERT_TRUE(tree.disallow(kCellar, kItem, ConsumerID{"com.example.1"}));
  limits.noteRemovals(tree);
  EXPECT_EQ(fill(kWriter), 1U);
  tree = {};
  limits.noteRemovals(tree);
  EXPECT_EQ(fill(kWriter), kWritersRoom / 2);
}

TEST_F(DVGrantLimitsOfWriters, AGrantThatHasGoneAndIsAddedByAnotherIsThatOnes) {
  ASSERT_EQ(fill(kWriter), kWritersRoom / 2);
  tree = {};
  for (std::size_t i = 1; i <= kWritersRoom / 2; ++i) {
    ASSERT_TRUE(isAdded({kCellar, ConsumerID{"com.example." + std::to_string(i)}, kItem}, kOtherWriter)) << i;
  }
  EXPECT_EQ(fill(kOtherWriter), 0U);
  EXPECT_EQ(fill(kWriter), kWritersRoom / 4);
}

TEST_F(DVGrantLimitsOfWriters, AGrantThatHasGoneAndIsAddedByTheEntitledIsNoWriters) {
  ASSERT_EQ(fill(kWriter), kWritersRoom / 2);
  tree = {};
  limits.noteRemovals(tree);
  for (std::size_t i = 1; i <= kWritersRoom / 2; ++i) {
    ASSERT_TRUE(isAdded({kCellar, ConsumerID{"com.example." + std::to_string(i)}, kItem}, kEntitled)) << i;
  }
  EXPECT_EQ(fill(kWriter), kWritersRoom / 4);
}

TEST_F(DVGrantLimitsOfWriters, EachLeavesHalfOfTheBytesOfAProvidersShareThatItFinds) {
  constexpr std::size_t kRoom = kDVMaximumBytesOfProvider - kDVBytesKeptForEntitled;
  const auto fillBytes = [this](const DVGranter& granter, const ProviderID& provider) {
    std::size_t bytes = 0;
    for (std::size_t length = kDVLongestGrantedItemID; length > 0;) {
      std::string name = std::to_string(++number);
      name.resize(length, 'i');
      if (isAdded({provider, ConsumerID{""}, ItemID{name}}, granter)) {
        bytes += length;
      } else {
        length /= 2;
      }
      if (length < name.size() && length < 16) break;
    }
    return bytes;
  };
  constexpr std::size_t kPart = 100;
  EXPECT_NEAR(static_cast<double>(fillBytes(kWriter, kCellar)), kRoom / 2, kRoom / kPart);
  EXPECT_NEAR(static_cast<double>(fillBytes(kOtherWriter, kCellar)), kRoom / 4, kRoom / kPart);
  EXPECT_NEAR(static_cast<double>(fillBytes(kWriter, ProviderID{"com.orvane.attic"})), kRoom / 2, kRoom / kPart);
}

// As DVGrantLimits.cpp counts them.
constexpr std::size_t kBytesAroundItem = 32;
constexpr std::size_t kBytesAroundConsumer = 160;
constexpr std::size_t kItemLength = 480;
constexpr std::size_t kBytesOfItem = kItemLength + kBytesAroundItem;

TEST(DVGrantLimits, AProvidersGrantsTakeNoMoreThanItsShareAndOthersHaveTheirOwn) {
  DVGrantTree tree;
  const std::size_t room = kDVMaximumBytesOfProvider - kBytesAroundConsumer - kEditor.value.size();
  const auto numbered = [](std::size_t number, std::size_t length) {
    const std::string text = std::to_string(number);
    return ItemID{std::string(length - text.size(), 'i') + text};
  };
  std::size_t taken = 0;
  for (; taken + 2 <= room / kBytesOfItem; ++taken) ASSERT_TRUE(tree.allow(kCellar, numbered(taken, kItemLength), kEditor));
  const std::size_t rest = room - taken * kBytesOfItem - kBytesAroundItem;
  EXPECT_FALSE(hasRoomFor(tree, {kCellar, kEditor, numbered(taken, rest + 1)}));
  EXPECT_TRUE(isTaken(tree, {kCellar, kEditor, numbered(taken, rest)}));
  EXPECT_FALSE(hasRoomFor(tree, {kCellar, kEditor, ItemID{""}}));
  EXPECT_TRUE(hasRoomFor(tree, {ProviderID{"com.orvane.attic"}, kEditor, kItem}));
}

TEST(DVGrantLimits, WhoeverMayWriteItemsLeavesHalfOfAProvidersShareToTheEntitled) {
  DVGrantTree tree;
  const ConsumerID anyone{""};
  const std::size_t room = kDVMaximumBytesOfProvider - kDVBytesKeptForEntitled - kBytesAroundConsumer;
  std::size_t taken = 0;
  for (; (taken + 2) * kBytesOfItem <= room; ++taken) {
    std::string name = std::to_string(taken);
    name.resize(kItemLength, 'i');
    ASSERT_TRUE(tree.allow(kCellar, ItemID{name}, anyone));
  }
  const std::size_t rest = room - taken * kBytesOfItem - kBytesAroundItem;
  EXPECT_TRUE(hasRoomForWriter(tree, {kCellar, anyone, ItemID{std::string(rest, 'r')}}));
  const DVGrant oneMore{kCellar, anyone, ItemID{std::string(rest + 1, 'r')}};
  EXPECT_FALSE(hasRoomForWriter(tree, oneMore));
  EXPECT_TRUE(hasRoomFor(tree, oneMore));
}

// The worst that eight providers can do: many small elements, or escapes alone.
void expectWritable(const std::string& consumerBeginning, const std::string& itemBeginning, std::size_t itemsOfConsumer) {
  DVGrantTree one;
  std::size_t number = 0;
  // Asked seldom, for it counts all there is: a few more come in than may.
  while (number % 1024 != 0 || hasRoomFor(one, {kCellar, ConsumerID{consumerBeginning}, ItemID{itemBeginning + "x"}})) {
    const ConsumerID consumer{consumerBeginning + std::to_string(number / itemsOfConsumer)};
    ASSERT_TRUE(one.allow(kCellar, ItemID{itemBeginning + std::to_string(number)}, consumer));
    ++number;
  }
  QXDictionary all;
  for (int i = 0; i < 8; ++i) all["com.orvane." + std::to_string(i)] = one.dictionary().begin()->second;
  EXPECT_TRUE(propertyListXML(all)) << number;
}

TEST(DVGrantLimits, EightProvidersThatTakeAllTheyCanStillLeaveAListThatCanBeWritten) {
  expectWritable("c", "", 100);
  expectWritable("c", "", 1);
  expectWritable(std::string(100, '&'), std::string(100, '&'), 1);
}

// Whether a list that holds a filler of that many bytes has room for an item of ten times that character.
bool hasRoomBesideFiller(std::size_t bytes, char character) {
  constexpr std::size_t kShare = 4000;
  DVGrantTree tree;
  for (std::size_t number = 0; bytes > 0; ++number) {
    const std::size_t share = bytes < 2 * kShare ? bytes : kShare;
    std::string name = std::to_string(number);
    name.resize(share - kBytesAroundItem, 'i');
    EXPECT_TRUE(tree.allow(kCellar, ItemID{name}, ConsumerID{""}));
    bytes -= share;
  }
  return hasRoomFor(tree, {kCellar, ConsumerID{""}, ItemID{std::string(10, character)}});
}

TEST(DVGrantLimits, ACharacterThatIsEscapedCountsAsLongAsItsEscape) {
  constexpr std::size_t kLeft = kDVMaximumBytesOfProvider - kBytesAroundConsumer - kBytesAroundItem;
  EXPECT_TRUE(hasRoomBesideFiller(kLeft - 10, 'a'));
  EXPECT_FALSE(hasRoomBesideFiller(kLeft - 9, 'a'));
  for (const char escaped : {'&', '<', '>', '\r'}) {
    EXPECT_TRUE(hasRoomBesideFiller(kLeft - 50, escaped)) << static_cast<int>(escaped);
    EXPECT_FALSE(hasRoomBesideFiller(kLeft - 49, escaped)) << static_cast<int>(escaped);
  }
}

}  // namespace
}  // namespace docuvend
