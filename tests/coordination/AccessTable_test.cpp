#include "platform/linux/coordination/AccessTable.h"

#include <gtest/gtest.h>

#include <vector>

#include "tests/coordination/Turns.h"

namespace docuvend::linux_platform {
namespace {

using testing::fileNamed;
using testing::partyOf;
using testing::processNumber;

using Entry = AccessTable::Entry;
using Numbers = std::vector<AccessNumber>;
using States = std::vector<AccessTable::State>;

struct AccessTableTest : ::testing::Test {
  // Accesses are numbered as they are asked for: 1, 2, 3 ...
  Entry read(const FileKey& file, const AccessParty& party) { return table.enter(++last, file, AccessKind::reading, party); }
  Entry write(const FileKey& file, const AccessParty& party) { return table.enter(++last, file, AccessKind::writing, party); }
  void expectAllLeave(const Numbers& numbers) {
    for (const AccessNumber number : numbers) (void)table.leave(number);
    EXPECT_TRUE(table.isEmpty());
  }

  const FileKey f = fileNamed("f");
  const FileKey g = fileNamed("g");
  const FileKey h = fileNamed("h");
  // Of processes with one party each.
  const AccessParty a = partyOf(1);
  const AccessParty b = partyOf(2);
  const AccessParty c = partyOf(3);
  const AccessParty d = partyOf(4);
  // A second party of the first process, and of the second.
  const AccessParty a2 = partyOf(1, 2);
  const AccessParty b2 = partyOf(2, 2);
  AccessTable table;
  AccessNumber last = 0;
};

TEST_F(AccessTableTest, LetsManyReadAtOnce) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::hasTurn);
  EXPECT_EQ(read(f, c), Entry::hasTurn);
  expectAllLeave({2, 1, 3});
}

TEST_F(AccessTableTest, LetsOneWriteAlone) {
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::waits);
  EXPECT_EQ(write(f, c), Entry::waits);
  EXPECT_EQ(table.leave(1), Numbers{2});
  EXPECT_EQ(table.leave(2), Numbers{3});
  EXPECT_EQ(table.leave(3), Numbers{});
  EXPECT_TRUE(table.isEmpty());
}

TEST_F(AccessTableTest, KeepsAWriterWaitingForEveryReader) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, c), Entry::waits);
  EXPECT_EQ(table.leave(2), Numbers{});
  EXPECT_EQ(table.leave(1), Numbers{3});
}

TEST_F(AccessTableTest, GivesTheTurnInTheOrderOfComing) {
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::waits);
  EXPECT_EQ(read(f, c), Entry::waits);
  EXPECT_EQ(write(f, d), Entry::waits);
  EXPECT_EQ(read(f, partyOf(5)), Entry::waits);
  EXPECT_EQ(table.leave(1), (Numbers{2, 3}));
  EXPECT_EQ(table.leave(3), Numbers{});
  EXPECT_EQ(table.leave(2), Numbers{4});
  EXPECT_EQ(table.leave(4), Numbers{5});
}

TEST_F(AccessTableTest, KeepsAReaderBehindAWriterWhoWaits) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(write(f, b), Entry::waits);
  EXPECT_EQ(read(f, c), Entry::waits);
  EXPECT_EQ(table.leave(1), Numbers{2});
  EXPECT_EQ(table.leave(2), Numbers{3});
}

TEST_F(AccessTableTest, TakesOneNameInTwoDirectoriesForTwoFiles) {
  FileKey elsewhere = f;
  elsewhere.directory.inode = 77;
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(write(elsewhere, b), Entry::hasTurn);
  EXPECT_EQ(write(g, c), Entry::hasTurn);
}

TEST_F(AccessTableTest, LetsAProcessReadWithinItsReadThoughAWriterQueues) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(write(f, b), Entry::waits);
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, a2), Entry::hasTurn) << "it is the process that has the turn";
  EXPECT_EQ(table.leave(1), Numbers{});
  EXPECT_EQ(table.leave(4), Numbers{});
  EXPECT_EQ(table.leave(3), Numbers{2}) << "the turn passes on when the last of them ends";
}

TEST_F(AccessTableTest, LetsAProcessReadAndWriteWithinItsWriteThoughOthersQueue) {
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(write(f, b), Entry::waits);
  EXPECT_EQ(read(f, c), Entry::waits);
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(write(f, a2), Entry::hasTurn);
  EXPECT_EQ(table.leave(1), Numbers{});
  EXPECT_EQ(table.leave(5), Numbers{});
  EXPECT_EQ(table.leave(6), Numbers{});
  EXPECT_EQ(table.leave(4), Numbers{2});
}

TEST_F(AccessTableTest, LetsAProcessWriteWithinItsReadWhenNobodyElseReads) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(write(f, b), Entry::waits);
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(table.leave(1), Numbers{});
  EXPECT_EQ(table.leave(3), Numbers{2});
}

TEST_F(AccessTableTest, LetsAWriterWithinItsReadWaitForTheOtherReadersAndGoBeforeTheQueue) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, c), Entry::waits);
  EXPECT_EQ(write(f, a), Entry::waits);
  EXPECT_EQ(table.of(f), (States{{1, true}, {2, true}, {4, false}, {3, false}}));
  EXPECT_EQ(table.leave(2), Numbers{4});
  EXPECT_EQ(table.leave(4), Numbers{});
  EXPECT_EQ(table.leave(1), Numbers{3});
}

TEST_F(AccessTableTest, KeepsTheHeadOfTheQueueForAWriterWhoseReadHasEnded) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, c), Entry::waits);
  EXPECT_EQ(write(f, a2), Entry::waits);
  EXPECT_EQ(table.leave(1), Numbers{});
  EXPECT_EQ(read(f, a), Entry::waits) << "its process has no turn any more";
  EXPECT_EQ(table.leave(2), Numbers{4});
}

TEST_F(AccessTableTest, RefusesTheSecondOfTwoWhoWriteWithinTheirReads) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, a), Entry::waits);
  EXPECT_EQ(write(f, b), Entry::wouldDeadlock);
  EXPECT_EQ(table.of(f), (States{{1, true}, {2, true}, {3, false}})) << "it is not entered";
  EXPECT_EQ(table.leave(4), Numbers{});
  EXPECT_EQ(table.leave(2), Numbers{3}) << "the second gives way";
}

TEST_F(AccessTableTest, RefusesAWriterWithinItsReadWhoWouldGoBeforeSomebodyWhomItWaitsFor) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, b2), Entry::waits);
  EXPECT_EQ(write(g, c), Entry::hasTurn);
  EXPECT_EQ(read(f, c), Entry::waits);
  EXPECT_EQ(read(g, b), Entry::waits);
  EXPECT_EQ(write(f, a2), Entry::wouldDeadlock) << "it waits for a reader who waits for one behind it";
}

TEST_F(AccessTableTest, LetsTwoWriteWithinReadsThatOtherPartiesHave) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, a2), Entry::waits);
  EXPECT_EQ(write(f, b2), Entry::waits);
  EXPECT_EQ(table.leave(1), Numbers{4});
  EXPECT_EQ(table.leave(4), Numbers{});
  EXPECT_EQ(table.leave(2), Numbers{3});
}

TEST_F(AccessTableTest, KeepsTheirPlaceForAccessesFromBeforeTheirProcessHadTheTurn) {
  EXPECT_EQ(write(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, a), Entry::waits);
  EXPECT_EQ(read(f, a2), Entry::waits);
  EXPECT_EQ(write(f, c), Entry::waits);
  EXPECT_EQ(read(f, partyOf(1, 3)), Entry::waits);
  EXPECT_EQ(table.leave(1), (Numbers{2, 3})) << "a process does not exclude itself";
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(table.of(f), (States{{2, true}, {3, true}, {6, true}, {4, false}, {5, false}}));
}

TEST_F(AccessTableTest, RefusesACycleOverTwoFiles) {
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(write(g, b), Entry::hasTurn);
  EXPECT_EQ(read(g, a), Entry::waits);
  EXPECT_EQ(read(f, b), Entry::wouldDeadlock);
  EXPECT_EQ(table.leave(2), Numbers{3});
  EXPECT_EQ(read(f, b), Entry::waits) << "that wait has an end";
}

TEST_F(AccessTableTest, RefusesACycleOverThreeFilesAndProcesses) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(read(g, b), Entry::hasTurn);
  EXPECT_EQ(write(h, c), Entry::hasTurn);
  EXPECT_EQ(write(g, a), Entry::waits);
  EXPECT_EQ(read(h, b), Entry::waits);
  EXPECT_EQ(write(f, d), Entry::waits) << "nobody waits for it";
  EXPECT_EQ(write(f, c), Entry::wouldDeadlock);
  EXPECT_EQ(table.of(f), (States{{1, true}, {6, false}}));
}

TEST_F(AccessTableTest, DoesNotTakeTwoPartiesOfOneProcessForACycle) {
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(write(g, b), Entry::hasTurn);
  EXPECT_EQ(write(g, a2), Entry::waits);
  EXPECT_EQ(write(f, b2), Entry::waits);
  EXPECT_EQ(table.leave(1), Numbers{4});
  EXPECT_EQ(table.leave(2), Numbers{3});
}

TEST_F(AccessTableTest, FindsACycleBetweenTheSecondPartiesOfTwoProcesses) {
  EXPECT_EQ(write(f, a2), Entry::hasTurn);
  EXPECT_EQ(write(g, b2), Entry::hasTurn);
  EXPECT_EQ(write(g, a2), Entry::waits);
  EXPECT_EQ(write(f, b2), Entry::wouldDeadlock);
}

TEST_F(AccessTableTest, FollowsTheWaitThroughThoseWhoQueueBefore) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(write(f, b), Entry::waits);
  EXPECT_EQ(write(g, c), Entry::hasTurn);
  EXPECT_EQ(read(g, a), Entry::waits);
  EXPECT_EQ(read(f, c), Entry::wouldDeadlock) << "only the writer before it keeps it from reading";
  EXPECT_EQ(table.leave(2), Numbers{});
  EXPECT_EQ(read(f, c), Entry::hasTurn);
}

TEST_F(AccessTableTest, FollowsTheWaitThroughItsOwnProcessWhoQueuesBefore) {
  EXPECT_EQ(read(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, a), Entry::waits);
  EXPECT_EQ(write(g, a2), Entry::hasTurn);
  EXPECT_EQ(read(g, b), Entry::waits);
  EXPECT_EQ(read(f, a2), Entry::wouldDeadlock) << "it reads together with the writer before it, who waits for the reader";
}

TEST_F(AccessTableTest, FollowsTheWaitThroughAReaderWhoKeepsOneOfTheWritersProcessBehindIt) {
  EXPECT_EQ(write(h, a2), Entry::hasTurn);
  EXPECT_EQ(write(g, d), Entry::hasTurn);
  EXPECT_EQ(write(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, a), Entry::waits);
  EXPECT_EQ(read(f, c), Entry::waits);
  EXPECT_EQ(read(f, a2), Entry::waits);
  EXPECT_EQ(table.leave(3), Numbers{4});
  EXPECT_EQ(read(h, d), Entry::waits);
  EXPECT_EQ(read(g, a), Entry::wouldDeadlock) << "its second party waits for nobody but the reader, who waits for its writer";
}

TEST_F(AccessTableTest, LetsAPartyQueueTwiceAtOneFile) {
  EXPECT_EQ(write(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, a), Entry::waits);
  EXPECT_EQ(read(f, a), Entry::waits);
  EXPECT_EQ(table.leave(1), (Numbers{2, 3}));
}

TEST_F(AccessTableTest, DoesNotTakeReadersWhoQueueBeforeAReaderForAHindrance) {
  EXPECT_EQ(write(f, d), Entry::hasTurn);
  EXPECT_EQ(write(g, b), Entry::hasTurn);
  EXPECT_EQ(read(f, a), Entry::waits);
  EXPECT_EQ(read(g, a), Entry::waits);
  EXPECT_EQ(read(f, b), Entry::waits);
  EXPECT_EQ(table.leave(1), (Numbers{3, 5}));
}

TEST_F(AccessTableTest, WaitsForAPartyThatWaitsForSomebodyElse) {
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(write(g, b), Entry::hasTurn);
  EXPECT_EQ(write(h, c), Entry::hasTurn);
  EXPECT_EQ(write(g, a), Entry::waits);
  EXPECT_EQ(write(f, c), Entry::waits) << "its chain ends at a party that goes on";
  EXPECT_EQ(table.leave(2), Numbers{4});
  EXPECT_EQ(table.leave(4), Numbers{});
  EXPECT_EQ(table.leave(1), Numbers{5});
}

TEST_F(AccessTableTest, LetsThoseBehindGoOnWhenOneWhoWaitsLeaves) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(write(f, b), Entry::waits);
  EXPECT_EQ(read(f, c), Entry::waits);
  EXPECT_EQ(read(f, d), Entry::waits);
  EXPECT_EQ(table.leave(4), Numbers{});
  EXPECT_EQ(table.leave(2), Numbers{3});
  expectAllLeave({1, 3});
}

TEST_F(AccessTableTest, LetsThoseBehindGoOnWhenAWriterWithinItsReadLeaves) {
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::hasTurn);
  EXPECT_EQ(write(f, a), Entry::waits);
  EXPECT_EQ(read(f, c), Entry::waits);
  EXPECT_EQ(table.leave(3), Numbers{4});
}

TEST_F(AccessTableTest, IgnoresTheEndOfWhatIsNotThere) {
  EXPECT_EQ(table.leave(7), Numbers{});
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::waits);
  EXPECT_EQ(table.leave(7), Numbers{});
  EXPECT_EQ(table.leave(1), Numbers{2});
  EXPECT_EQ(table.leave(1), Numbers{});
  EXPECT_EQ(table.of(f), (States{{2, true}}));
}

TEST_F(AccessTableTest, NamesThoseThatHaveTheTurnAndThenThoseThatWait) {
  EXPECT_EQ(table.of(f), States{});
  EXPECT_EQ(write(g, d), Entry::hasTurn);
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(read(f, b), Entry::waits);
  EXPECT_EQ(write(f, c), Entry::waits);
  EXPECT_EQ(read(f, a), Entry::hasTurn);
  EXPECT_EQ(table.of(f), (States{{2, true}, {5, true}, {3, false}, {4, false}}));
  expectAllLeave({1, 2, 3, 4, 5});
  EXPECT_EQ(table.of(f), States{});
}

TEST_F(AccessTableTest, KnowsWhichProcessHasTheTurnAndWhichWrites) {
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(write(f, b), Entry::waits);
  EXPECT_EQ(read(g, b), Entry::hasTurn);
  EXPECT_TRUE(table.hasTurn(processNumber(1), f));
  EXPECT_TRUE(table.isWriting(processNumber(1), f));
  EXPECT_FALSE(table.hasTurn(processNumber(2), f));
  EXPECT_FALSE(table.isWriting(processNumber(2), f)) << "it waits";
  EXPECT_TRUE(table.hasTurn(processNumber(2), g));
  EXPECT_FALSE(table.isWriting(processNumber(2), g)) << "it reads";
  EXPECT_FALSE(table.hasTurn(processNumber(1), h));
  EXPECT_FALSE(table.isWriting(processNumber(1), h));
}

TEST_F(AccessTableTest, IsAValue) {
  EXPECT_EQ(write(f, a), Entry::hasTurn);
  EXPECT_EQ(write(f, b), Entry::waits);
  AccessTable copy = table;
  expectAllLeave({2, 1});
  EXPECT_EQ(copy.leave(1), Numbers{2});
}

}  // namespace
}  // namespace docuvend::linux_platform
