#include "platform/linux/sandbox/RedemptionLedger.h"

#include <gtest/gtest.h>

#include <string>

namespace docuvend::linux_platform {
namespace {

const std::string kPath = "/groups/one/item";

ObjectIdentity object(std::uint64_t inode) {
  ObjectIdentity identity;
  identity.device = 1;
  identity.inode = inode;
  return identity;
}

TEST(RedemptionLedger, HoldsWhatWasEnteredForThatInstanceAndObjectAlone) {
  RedemptionLedger ledger;
  ledger.enter("a", {object(1), kPath});
  EXPECT_TRUE(ledger.holds("a", object(1)));
  EXPECT_FALSE(ledger.holds("a", object(2)));
  EXPECT_FALSE(ledger.holds("b", object(1)));
}

TEST(RedemptionLedger, TellsAnObjectFromALaterOneOfTheSameNumber) {
  RedemptionLedger ledger;
  ledger.enter("a", {object(1), kPath});
  ObjectIdentity later = object(1);
  later.bornNanoseconds = 1;
  EXPECT_FALSE(ledger.holds("a", later));
  ObjectIdentity elsewhere = object(1);
  elsewhere.device = 2;
  EXPECT_FALSE(ledger.holds("a", elsewhere));
}

TEST(RedemptionLedger, EntersNothingForAnEmptyInstance) {
  RedemptionLedger ledger;
  ledger.enter("", {object(1), kPath});
  EXPECT_FALSE(ledger.holds("", object(1)));
}

TEST(RedemptionLedger, ForgetsAllAndGoesOn) {
  RedemptionLedger ledger;
  ledger.enter("a", {object(1), kPath});
  ledger.enter("b", {object(2), kPath});
  ledger.forgetAll();
  EXPECT_FALSE(ledger.holds("a", object(1)));
  EXPECT_FALSE(ledger.holds("b", object(2)));
  ledger.enter("a", {object(1), kPath});
  EXPECT_TRUE(ledger.holds("a", object(1)));
}

TEST(RedemptionLedger, ForgetsWhatWasNamedBelowADirectoryAndKeepsTheRest) {
  RedemptionLedger ledger;
  ledger.enter("a", {object(1), "/groups/one/item"});
  ledger.enter("a", {object(2), "/groups/one.more/item"});
  ledger.enter("b", {object(1), "/home/groups/one/item"});
  ledger.enter("c", {object(3), "/groups/two/item"});
  ledger.forgetBelow({});
  EXPECT_TRUE(ledger.holds("a", object(1)));
  ledger.forgetBelow({"/groups/one/", "/home/groups/one/"});
  EXPECT_FALSE(ledger.holds("a", object(1)));
  EXPECT_TRUE(ledger.holds("a", object(2)));
  EXPECT_FALSE(ledger.holds("b", object(1)));
  EXPECT_TRUE(ledger.holds("c", object(3)));
  ledger.forgetBelow({"/"});
  EXPECT_FALSE(ledger.holds("a", object(2)));
  EXPECT_FALSE(ledger.holds("c", object(3)));
}

TEST(RedemptionLedger, ForgetsTheOldestObjectOfAFullInstance) {
  RedemptionLedger ledger;
  for (std::uint64_t inode = 0; inode < RedemptionLedger::kMaximumObjectsPerInstance; ++inode) ledger.enter("a", {object(inode), kPath});
  ledger.enter("a", {object(0), kPath});  // again: the youngest now
  EXPECT_TRUE(ledger.holds("a", object(1)));
  ledger.enter("a", {object(100000), kPath});
  EXPECT_TRUE(ledger.holds("a", object(0)));
  EXPECT_FALSE(ledger.holds("a", object(1)));
  EXPECT_TRUE(ledger.holds("a", object(2)));
  EXPECT_TRUE(ledger.holds("a", object(100000)));
}

TEST(RedemptionLedger, ForgetsTheInstanceThatWasIdleLongestWhenFull) {
  RedemptionLedger ledger;
  for (std::size_t i = 0; i < RedemptionLedger::kMaximumInstances; ++i) ledger.enter(std::to_string(i), {object(1), kPath});
  ledger.enter("0", {object(2), kPath});
  ledger.enter("new", {object(1), kPath});
  EXPECT_TRUE(ledger.holds("0", object(1)));
  EXPECT_TRUE(ledger.holds("0", object(2)));
  EXPECT_FALSE(ledger.holds("1", object(1)));
  EXPECT_TRUE(ledger.holds("2", object(1)));
  EXPECT_TRUE(ledger.holds("new", object(1)));
}

}  // namespace
}  // namespace docuvend::linux_platform
