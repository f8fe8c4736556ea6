// Turns at files among real processes: who waits for whom, and what becomes of the turn of one that leaves.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "tests/system/house/TurnTest.h"

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;
using ::testing::StartsWith;

constexpr const char* kWouldDeadlock = "QXFileCoordinationErrorDomain 5";
constexpr const char* kDeadlinePassed = "DVConsumerErrorDomain 2";
constexpr const char* kConnectionLost = "DVConsumerErrorDomain 5";

using Lines = std::vector<std::string>;

class Coordination : public TurnTest {
 protected:
  void SetUp() override {
    TurnTest::SetUp();
    file_ = trick("file");
  }
  // Both of which one has got the error, and the other one everything.
  static void expectOneInADeadlock(const Lines& first, const Lines& second, const Lines& served, const Lines& refused) {
    const bool isFirst = first == refused;
    EXPECT_EQ(isFirst ? second : first, served) << "the one that goes on";
    EXPECT_EQ(isFirst ? first : second, refused) << "the one that was told";
  }

  QXURL file_ = url("/");
};

TEST_F(Coordination, ManyReadAtOnceAndAWriterWaitsForAllOfThem) {
  const auto one = holder("reading", file_, "one");
  const auto two = holder("reading", file_, "two");
  const auto writer = waiter("writing", file_);
  letGo(place("one"));
  EXPECT_THAT(linesOf(*one), ElementsAre("ok", "ok", "ok"));
  awaitHolders(file_, {"reading holding", "writing waiting"});
  letGo(place("two"));
  EXPECT_THAT(linesOf(*two), ElementsAre("ok", "ok", "ok"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok"));
  EXPECT_EQ(timesTold(file_), 1);
  EXPECT_TRUE(holders(file_).empty());
}

TEST_F(Coordination, WhoComesFirstIsServedFirstAlsoAReaderBehindAWriter) {
  const auto first = holder("reading", file_, "first");
  const auto writer = ask({"writing", file_.absoluteString(), "hold", place("writer"), "end"});
  awaitHolders(file_, {"reading holding", "writing waiting"});
  const auto reader = waiter("reading", file_);
  letGo(place("first"));
  awaitHolding(place("writer"));
  EXPECT_THAT(holders(file_), ElementsAre("writing holding", "reading waiting"));
  letGo(place("writer"));
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok"));
  EXPECT_THAT(linesOf(*first), ElementsAre("ok", "ok", "ok"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok", "ok"));
}

TEST_F(Coordination, TwoFilesAreTwoTurns) {
  const auto writer = holder("writing", file_, "writer");
  EXPECT_THAT(answers({"writing", trick("other").absoluteString(), "end"}), ElementsAre("ok", "ok"));
  letGo(place("writer"));
}

TEST_F(Coordination, AFileThatIsReplacedMeanwhileIsTheSameFile) {
  writeFile(file_.fileSystemPath(), "old");
  const auto writer = holder("writing", file_, "writer");
  writeFile(file_.fileSystemPath() + ".new", "new");
  std::filesystem::rename(file_.fileSystemPath() + ".new", file_.fileSystemPath());
  const auto reader = waiter("reading", file_);
  letGo(place("writer"));
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok"));
}

TEST_F(Coordination, ADeadlineEndsAWaitAndThoseBehindItGoOn) {
  const auto reader = holder("reading", file_, "reader");
  const auto impatient = ask({"within", "500", "writing", file_.absoluteString(), "hold", place("impatient")});
  eventually("it waits, or has waited",
             [this] { return holders(file_).size() == 2 || std::filesystem::exists(place("impatient") + ".holding"); });
  // For the writer alone: the other reader still holds.
  EXPECT_THAT(answers({"reading", file_.absoluteString(), "end"}), ElementsAre("ok", "ok"));
  awaitHolding(place("impatient"));
  letGo(place("impatient"));
  EXPECT_THAT(linesOf(*impatient), ElementsAre("ok", kDeadlinePassed, "ok"));
  letGo(place("reader"));
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok", "ok"));
  EXPECT_EQ(timesTold(file_), 0);
}

// --- Those who leave

TEST_F(Coordination, AKilledReaderReleasesItsTurn) {
  const auto reader = holder("reading", file_, "reader");
  const auto writer = waiter("writing", file_);
  killNow(*reader);
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok"));
}

TEST_F(Coordination, OfAWriterThatIsKilledInTheMiddleTheProviderIsToldOnceAndTheTurnPassesOn) {
  const auto writer = holder("writing", file_, "writer");
  const auto reader = ask({"reading", file_.absoluteString(), "hold", place("reader"), "end"});
  awaitHolders(file_, {"writing holding", "reading waiting"});
  EXPECT_EQ(timesTold(file_), 0);
  killNow(*writer);
  awaitHolding(place("reader"));
  EXPECT_EQ(timesTold(file_), 1) << "before the turn passes on";
  letGo(place("reader"));
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok", "ok"));
  EXPECT_EQ(timesTold(file_), 1);
}

TEST_F(Coordination, OfAWriterThatIsKilledWhileItWaitsTheProviderIsNotTold) {
  const auto reader = holder("reading", file_, "reader");
  const auto writer = waiter("writing", file_);
  killNow(*writer);
  awaitHolders(file_, {"reading holding"});
  letGo(place("reader"));
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok", "ok"));
  EXPECT_TRUE(holders(file_).empty());
  EXPECT_EQ(timesTold(file_), 0);
}

TEST_F(Coordination, AProgramThatEndsWithATurnInHandReleasesIt) {
  const auto leaver = ask({"writing", file_.absoluteString()});
  EXPECT_THAT(linesOf(*leaver), ElementsAre("ok"));
  EXPECT_THAT(answers({"reading", file_.absoluteString(), "end"}), ElementsAre("ok", "ok"));
  EXPECT_EQ(timesTold(file_), 1);
}

// --- One process, several turns

TEST_F(Coordination, AProcessThatHasTheFileReadsItAgainAtOnceThoughAWriterWaits) {
  const auto reader = ask({"reading", file_.absoluteString(), "hold", place("reader"), "reading", file_.absoluteString(), "hold",
                           place("again"), "end", "end"});
  awaitHolding(place("reader"));
  const auto writer = waiter("writing", file_);
  letGo(place("reader"));
  awaitHolding(place("again"));
  EXPECT_THAT(holders(file_), ElementsAre("reading holding", "reading holding", "writing waiting"));
  letGo(place("again"));
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok", "ok", "ok", "ok", "ok"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok"));
}

TEST_F(Coordination, AWriterReadsAndWritesWithinItsWriteAtOnceThoughOthersWait) {
  const std::string file = file_.absoluteString();
  const auto writer = ask({"writing", file, "hold", place("writer"), "reading", file, "writing", file, "end", "end", "end"});
  awaitHolding(place("writer"));
  const auto reader = waiter("reading", file_);
  letGo(place("writer"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok", "ok", "ok", "ok", "ok", "ok"));
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok"));
}

TEST_F(Coordination, AWriteWithinAReadWaitsForTheOtherReadersAndGoesBeforeThoseWhoQueue) {
  const auto other = holder("reading", file_, "other");
  const auto upgrader =
      ask({"reading", file_.absoluteString(), "hold", place("reader"), "writing", file_.absoluteString(), "hold", place("writer")});
  awaitHolding(place("reader"));
  const auto queued = waiter("writing", file_);
  letGo(place("reader"));
  awaitHolders(file_, {"reading holding", "reading holding", "writing waiting", "writing waiting"});
  letGo(place("other"));
  awaitHolding(place("writer"));
  EXPECT_TRUE(queued->isRunning());
  letGo(place("writer"));
  EXPECT_THAT(linesOf(*upgrader), ElementsAre("ok", "ok", "ok", "ok"));
  EXPECT_THAT(linesOf(*queued), ElementsAre("ok", "ok"));
}

TEST_F(Coordination, OfTwoReadersThatBothWantToWriteOneIsToldAndTheOtherWrites) {
  const auto upgrader = [this](const std::string& name) {
    return ask({"reading", file_.absoluteString(), "hold", place(name), "writing", file_.absoluteString(), "end", "end"});
  };
  const auto one = upgrader("one");
  const auto two = upgrader("two");
  awaitHolding(place("one"));
  awaitHolding(place("two"));
  letGo(place("one"));
  letGo(place("two"));
  expectOneInADeadlock(linesOf(*one), linesOf(*two), {"ok", "ok", "ok", "ok", "ok"}, {"ok", "ok", kWouldDeadlock, "ok", "no turn"});
  EXPECT_EQ(timesTold(file_), 1);
}

TEST_F(Coordination, OfTwoThatTakeTwoFilesInOppositeOrdersOneIsTold) {
  const QXURL other = trick("other");
  const auto taker = [this](const std::string& name, const QXURL& first, const QXURL& second) {
    return ask({"writing", first.absoluteString(), "hold", place(name), "writing", second.absoluteString(), "end", "end"});
  };
  const auto one = taker("one", file_, other);
  const auto two = taker("two", other, file_);
  awaitHolding(place("one"));
  awaitHolding(place("two"));
  letGo(place("one"));
  letGo(place("two"));
  expectOneInADeadlock(linesOf(*one), linesOf(*two), {"ok", "ok", "ok", "ok", "ok"}, {"ok", "ok", kWouldDeadlock, "ok", "no turn"});
}

// --- The daemon's end

TEST_F(Coordination, AHolderFindsOutThatTheDaemonWasKilledAndTheNextOneGrantsAnew) {
  const auto writer = ask({"writing", file_.absoluteString(), "hold", place("writer"), "lost", "end", "hold", place("between"), "writing",
                           file_.absoluteString(), "hold", place("anew"), "end"});
  awaitHolding(place("writer"));
  house_.killDaemon();
  letGo(place("writer"));
  awaitHolding(place("between"));
  house_.startDaemon();
  EXPECT_TRUE(holders(file_).empty()) << "the new daemon knows of no turn";
  letGo(place("between"));
  awaitHolding(place("anew"));
  EXPECT_THAT(holders(file_), ElementsAre("writing holding"));
  letGo(place("anew"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok", "ok", StartsWith(kConnectionLost), "ok", "ok", "ok", "ok"));
  EXPECT_EQ(timesTold(file_), 1) << "of the second write";
}

TEST_F(Coordination, AWaiterOutlivesTheDaemonAndGetsItsTurnOfTheNextOne) {
  const auto reader = holder("reading", file_, "reader");
  const auto writer = waiter("writing", file_);
  house_.killDaemon();
  house_.startDaemon();
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok"));
  letGo(place("reader"));
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok", StartsWith(kConnectionLost)));
}

}  // namespace
}  // namespace docuvend::tests
