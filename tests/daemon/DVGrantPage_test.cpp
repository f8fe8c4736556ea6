#include "daemon/DVGrantPage.h"

#include <gtest/gtest.h>

#include <string>
#include <variant>
#include <vector>

#include "platform/linux/wire/Frame.h"
#include "platform/linux/wire/Limits.h"

namespace docuvend {
namespace {

const ProviderID kCellar{"com.orvane.cellar"};
const ProviderID kAttic{"com.orvane.attic"};
const ConsumerID kEditor{"com.example.editor"};
const ConsumerID kPicker{"com.example.picker"};

QXValue entry(const ProviderID& provider, const ConsumerID& consumer, const std::string& item) {
  return QXDictionary{{"providerIdentifier", provider.value}, {"consumerIdentifier", consumer.value}, {"itemIdentifier", item}};
}

std::vector<DVGrant> numbered(std::size_t count) {
  std::vector<DVGrant> list;
  for (std::size_t i = 0; i < count; ++i) list.push_back({kCellar, kEditor, ItemID{std::to_string(i)}});
  return list;
}

std::vector<DVGrant> ofLength(std::size_t count, std::size_t itemBytes) {
  std::vector<DVGrant> list;
  for (std::size_t i = 0; i < count; ++i) list.push_back({ProviderID{""}, ConsumerID{""}, ItemID{std::string(itemBytes, 'i')}});
  return list;
}

// As long as an answer with this page.
bool fitsIntoAMessage(const DVGrantPage& page) {
  linux_platform::ReplyFrame reply{1, {QXValue(), page.grants, static_cast<std::int64_t>(page.next.value_or(0))}};
  return std::holds_alternative<linux_platform::EncodedFrame>(linux_platform::encodeFrame(std::move(reply)));
}

TEST(DVGrantPage, NamesTheThreeIdentifiersOfEachGrant) {
  const auto page = DVGrantPage::of({{kAttic, kPicker, ItemID{"7"}}, {kCellar, kEditor, ItemID{""}}}, {}, 0);
  EXPECT_EQ(page.grants, (QXArray{entry(kAttic, kPicker, "7"), entry(kCellar, kEditor, "")}));
  EXPECT_EQ(page.next, std::nullopt);
}

TEST(DVGrantPage, OfAnEmptyListIsTheLastAndEmpty) {
  const auto page = DVGrantPage::of({}, {}, 0);
  EXPECT_TRUE(page.grants.empty());
  EXPECT_EQ(page.next, std::nullopt);
}

TEST(DVGrantPage, HoldsAtMostAThousandGrantsAndSaysWhereTheNextOneStarts) {
  EXPECT_EQ(DVGrantPage::of(numbered(kDVMaximumGrantsOfPage), {}, 0).next, std::nullopt);
  const auto list = numbered(2 * kDVMaximumGrantsOfPage + 1);
  const auto first = DVGrantPage::of(list, {}, 0);
  EXPECT_EQ(first.grants.size(), kDVMaximumGrantsOfPage);
  EXPECT_EQ(first.next, kDVMaximumGrantsOfPage);
  const auto second = DVGrantPage::of(list, {}, *first.next);
  EXPECT_EQ(second.grants.size(), kDVMaximumGrantsOfPage);
  EXPECT_EQ(second.grants.front(), entry(kCellar, kEditor, "1000"));
  const auto third = DVGrantPage::of(list, {}, *second.next);
  EXPECT_EQ(third.grants, QXArray{entry(kCellar, kEditor, "2000")});
  EXPECT_EQ(third.next, std::nullopt);
}

TEST(DVGrantPage, EndsBeforeItsTextIsTooLong) {
  constexpr std::size_t kItem = std::size_t{1} << 15U;
  constexpr std::size_t kFitting = kDVMaximumTextBytesOfPage / kItem;
  EXPECT_EQ(DVGrantPage::of(ofLength(kFitting, kItem), {}, 0).next, std::nullopt);
  const auto page = DVGrantPage::of(ofLength(kFitting + 1, kItem), {}, 0);
  EXPECT_EQ(page.grants.size(), kFitting);
  EXPECT_EQ(page.next, kFitting);
  EXPECT_EQ(DVGrantPage::of(ofLength(kFitting, kItem + 1), {}, 0).next, kFitting - 1);
}

TEST(DVGrantPage, CountsTheTextOfAllThreeIdentifiers) {
  constexpr std::size_t kThird = kDVMaximumTextBytesOfPage / 16;
  const std::string text(kThird, 'x');
  const std::vector<DVGrant> list(16, {ProviderID{text}, ConsumerID{text}, ItemID{text}});
  EXPECT_EQ(DVGrantPage::of(list, {}, 0).grants.size(), 5U);
}

TEST(DVGrantPage, CountsNoTextOfWhatTheFilterLeavesOut) {
  auto list = ofLength(2, kDVMaximumTextBytesOfPage / 2);
  list.push_back({kCellar, kEditor, ItemID{"7"}});
  DVGrantFilter filter;
  filter.provider = kCellar;
  const auto page = DVGrantPage::of(list, filter, 0);
  EXPECT_EQ(page.grants, QXArray{entry(kCellar, kEditor, "7")});
  EXPECT_EQ(page.next, std::nullopt);
}

TEST(DVGrantPage, FitsIntoAMessageWhateverItHolds) {
  EXPECT_TRUE(fitsIntoAMessage(DVGrantPage::of(numbered(2 * kDVMaximumGrantsOfPage), {}, 0)));
  const std::string text(kDVLongestIdentifier, 'x');
  EXPECT_TRUE(fitsIntoAMessage(DVGrantPage::of(std::vector<DVGrant>(9, {ProviderID{text}, ConsumerID{text}, ItemID{text}}), {}, 0)));
  // The most text with the most grants.
  const std::string third(kDVMaximumTextBytesOfPage / kDVMaximumGrantsOfPage / 3, 'x');
  const std::vector<DVGrant> list(2 * kDVMaximumGrantsOfPage, {ProviderID{third}, ConsumerID{third}, ItemID{third}});
  const auto page = DVGrantPage::of(list, {}, 0);
  EXPECT_EQ(page.grants.size(), kDVMaximumGrantsOfPage);
  EXPECT_TRUE(fitsIntoAMessage(page));
}

TEST(DVGrantPage, IsAsLongAsTheProtocolsPageSays) {
  EXPECT_EQ(kDVMaximumGrantsOfPage, 1000U);
  EXPECT_EQ(kDVMaximumTextBytesOfPage, 524288U);
  EXPECT_EQ(kDVLongestIdentifier, 65536U);
}

TEST(DVGrantPage, ALongestIdentifierIsWhatAMessageCarriesAndALongerOneIsLeftOut) {
  EXPECT_EQ(kDVLongestIdentifier, linux_platform::kMaximumTextBytes);
  const std::string longest(kDVLongestIdentifier, 'x');
  const std::string tooLong = longest + "x";
  const std::vector<DVGrant> list = {{ProviderID{tooLong}, kEditor, ItemID{"1"}},
                                     {kCellar, ConsumerID{tooLong}, ItemID{"2"}},
                                     {kCellar, kEditor, ItemID{tooLong}},
                                     {kCellar, kEditor, ItemID{longest}},
                                     {kCellar, kEditor, ItemID{tooLong}}};
  const auto page = DVGrantPage::of(list, {}, 0);
  EXPECT_EQ(page.grants, QXArray{entry(kCellar, kEditor, longest)});
  EXPECT_EQ(page.next, std::nullopt);
}

TEST(DVGrantPage, AFilterAdmitsWhatIsOfItsProviderAndItsConsumer) {
  const std::vector<DVGrant> list = {
      {kAttic, kEditor, ItemID{"1"}}, {kAttic, kPicker, ItemID{"2"}}, {kCellar, kEditor, ItemID{"3"}}, {kCellar, kPicker, ItemID{"4"}}};
  EXPECT_EQ(DVGrantPage::of(list, {kAttic, std::nullopt}, 0).grants, (QXArray{entry(kAttic, kEditor, "1"), entry(kAttic, kPicker, "2")}));
  EXPECT_EQ(DVGrantPage::of(list, {std::nullopt, kEditor}, 0).grants, (QXArray{entry(kAttic, kEditor, "1"), entry(kCellar, kEditor, "3")}));
  EXPECT_EQ(DVGrantPage::of(list, {kCellar, kPicker}, 0).grants, QXArray{entry(kCellar, kPicker, "4")});
  EXPECT_TRUE(DVGrantPage::of(list, {ProviderID{""}, std::nullopt}, 0).grants.empty()) << "an empty identifier is one like any other";
}

TEST(DVGrantPage, WhatAFilterLeavesOutNeitherFillsAPageNorMakesAnother) {
  auto list = numbered(kDVMaximumGrantsOfPage);
  list.insert(list.begin() + 10, kDVMaximumGrantsOfPage, {kAttic, kPicker, ItemID{"other"}});
  list.push_back({kAttic, kPicker, ItemID{"last"}});
  const auto page = DVGrantPage::of(list, {kCellar, std::nullopt}, 0);
  EXPECT_EQ(page.grants.size(), kDVMaximumGrantsOfPage);
  EXPECT_EQ(page.next, std::nullopt);
  list.push_back({kCellar, kPicker, ItemID{"one more"}});
  EXPECT_EQ(DVGrantPage::of(list, {kCellar, std::nullopt}, 0).next, list.size() - 1);
}

TEST(DVGrantPage, PositionsAreThoseOfTheWholeList) {
  const auto list = numbered(5);
  EXPECT_EQ(DVGrantPage::of(list, {}, 4).grants, QXArray{entry(kCellar, kEditor, "4")});
  EXPECT_TRUE(DVGrantPage::of(list, {}, 5).grants.empty());
}

}  // namespace
}  // namespace docuvend
