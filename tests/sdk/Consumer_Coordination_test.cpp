#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <future>
#include <memory>
#include <set>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>
#include <vector>

#include "common/DVErrors.h"
#include "platform/rpc_errors.h"
#include "sdk/Consumer.h"
#include "tests/sdk/ScriptedDaemon.h"
#include "tests/support/Eventually.h"

namespace docuvend::tests {
namespace {

using linux_platform::FileCoordinationErrorCode;
using linux_platform::QXFileCoordination;
using linux_platform::SandboxErrorCode;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;
using namespace std::chrono_literals;

constexpr auto kNever = std::chrono::hours(24);
constexpr const char* kRead = "read file:///storage/letter.txt";
constexpr const char* kWrite = "write file:///storage/letter.txt";

QXError coordinationError(FileCoordinationErrorCode code) {
  return QXError::make(linux_platform::kQXFileCoordinationErrorDomain, static_cast<std::int64_t>(code), "of a test");
}

QXError badToken() {
  return QXError::make(linux_platform::kQXSandboxErrorDomain, static_cast<std::int64_t>(SandboxErrorCode::badToken), "of a test");
}

class ConsumerCoordinationTest : public ConsumerTest {
 protected:
  [[nodiscard]] static QXError noRoom() {
    return QXError::make(kQXRpcErrorDomain, static_cast<std::int64_t>(QXRpcErrorCode::tooManyCalls), "too much waits");
  }
  [[nodiscard]] const QXURL& url() const { return *script_.url; }
  // Nothing but a test's own deadline ends a wait, and a daemon that is gone is missed at once.
  Consumer& patient() {
    Consumer::Options options;
    options.deadline = options.materialisingDeadline = kNever;
    options.restartPatience = 0ms;
    return consumer(options);
  }
  // Requests for accesses are put into `begun_` instead of being answered.
  void holdAccesses() {
    script_.accessing = [this](QXFileCoordination::ErrorReply reply) { begun_.put(std::move(reply)); };
  }
  void holdEnds() {
    script_.ending = [this](QXFileCoordination::ErrorReply reply) { ended_.put(std::move(reply)); };
  }
  // The access, which must have begun.
  static CoordinatedAccess taken(Result<CoordinatedAccess> result) {
    if (const auto* error = std::get_if<QXError>(&result)) throw std::runtime_error(error->description());
    return std::get<CoordinatedAccess>(std::move(result));
  }
  [[nodiscard]] std::size_t count(const std::string& call) const {
    const auto all = calls_.all();
    return static_cast<std::size_t>(std::count(all.begin(), all.end(), call));
  }

  Mailbox<QXFileCoordination::ErrorReply> begun_;
  Mailbox<QXFileCoordination::ErrorReply> ended_;
};

// Beginning.

TEST_F(ConsumerCoordinationTest, AnAccessHasBegunWhenItIsAnsweredAndEndsByTheSameName) {
  startServices();
  auto reading = taken(patient().coordinateReading(url()));
  EXPECT_TRUE(reading.isHeld());
  EXPECT_EQ(reading.url(), url());
  EXPECT_EQ(reading.end(), std::nullopt);
  EXPECT_FALSE(reading.isHeld());
  auto writing = taken(consumer_->coordinateWriting(url()));
  EXPECT_EQ(writing.end(), std::nullopt);
  EXPECT_THAT(calls_.all(), ElementsAre(kRead, "end", kWrite, "end"));
  const auto first = names_.asked.take();
  const auto second = names_.asked.take();
  EXPECT_EQ(names_.ended.take(), first->accessID);
  EXPECT_EQ(names_.ended.take(), second->accessID);
  EXPECT_NE(first->accessID, second->accessID);
}

TEST_F(ConsumerCoordinationTest, AnAccessesNameIsARandomUUID) {
  startServices();
  patient();
  std::set<QXUUID> names;
  constexpr std::size_t kAccesses = 20;
  for (std::size_t i = 0; i < kAccesses; ++i) {
    (void)taken(consumer_->coordinateReading(url()));
    const QXUUID name = names_.asked.take()->accessID;
    EXPECT_EQ(name.string()[14], '4') << name.string();
    EXPECT_THAT(name.string()[19], ::testing::AnyOf('8', '9', 'A', 'B')) << name.string();
    names.insert(name);
  }
  EXPECT_THAT(names, SizeIs(kAccesses));
}

TEST_F(ConsumerCoordinationTest, ATokenGoesWithTheRequest) {
  startServices();
  const CoordinationOptions options{.token = QXData::fromText("key")};
  EXPECT_EQ(errorIn(patient().coordinateReading(url(), options)), std::nullopt);
  EXPECT_EQ(errorIn(consumer_->coordinateWriting(url(), options)), std::nullopt);
  EXPECT_THAT(calls_.all(), ElementsAre(std::string(kRead) + " by key", "end", std::string(kWrite) + " by key", "end"));
}

TEST_F(ConsumerCoordinationTest, ErrorsComeThroughAsTheyWereAnsweredAndNothingIsEnded) {
  startServices();
  patient();
  for (const QXError& error :
       {coordinationError(FileCoordinationErrorCode::notPermitted), coordinationError(FileCoordinationErrorCode::wouldDeadlock),
        coordinationError(FileCoordinationErrorCode::ended), coordinationError(FileCoordinationErrorCode::tooManyAccesses),
        coordinationError(FileCoordinationErrorCode::noDirectory), coordinationError(FileCoordinationErrorCode::tooManyChanges), badToken(),
        DVPluginOperationFailedError(QXError::make("Test", 1, "no contents"))}) {
    script_.accessing = [&error](const QXFileCoordination::ErrorReply& reply) { reply(error); };
    EXPECT_EQ(std::get<QXError>(consumer_->coordinateReading(url())), error);
    EXPECT_EQ(std::get<QXError>(consumer_->coordinateWriting(url())), error);
  }
  EXPECT_EQ(count("end"), 0U);
}

TEST_F(ConsumerCoordinationTest, WithoutADaemonItIsUnreachable) {
  startServices();
  patient();
  stopServices();
  EXPECT_EQ(errorIn(consumer_->coordinateReading(url())), own(ConsumerErrorCode::unreachable));
  EXPECT_EQ(errorIn(consumer_->holders(url())), own(ConsumerErrorCode::unreachable));
}

// Documents.

TEST_F(ConsumerCoordinationTest, ADocumentsTokenGoesWithTheRequestAndNoOther) {
  startServices();
  Document letter = document();
  EXPECT_EQ(errorIn(patient().coordinateReading(letter, {.token = QXData::fromText("another")})), std::nullopt);
  letter.itemToken.reset();
  EXPECT_EQ(errorIn(consumer_->coordinateWriting(letter)), std::nullopt) << "its path may do";
  EXPECT_THAT(calls_.all(), ElementsAre(std::string(kRead) + " by item", "end", kWrite, "end"));
}

TEST_F(ConsumerCoordinationTest, ADocumentWithItsStringIsCoordinatedWithNewTokensWhenTheOldOnesAreWorthless) {
  startServices();
  patient();
  for (const QXError& refusal : {badToken(), coordinationError(FileCoordinationErrorCode::notPermitted)}) {
    script_.url = QXURL::fromString("file:///storage/letter.txt");
    script_.itemToken = QXData::fromText("item");
    Document old = document();
    old.bookmarkableString = "docuvend:p/i";
    script_.url = QXURL::fromString("file:///storage/moved.txt");
    script_.itemToken = QXData::fromText("newer");
    bool isFirst = true;
    script_.accessing = [&isFirst, &refusal](const QXFileCoordination::ErrorReply& reply) {
      reply(std::exchange(isFirst, false) ? std::optional(refusal) : std::nullopt);
    };
    const std::size_t before = calls_.all().size();
    EXPECT_EQ(taken(consumer_->coordinateWriting(old)).url(), *script_.url);
    const auto all = calls_.all();
    EXPECT_THAT(
        std::vector(all.begin() + static_cast<std::ptrdiff_t>(before), all.end()),
        ElementsAre(std::string(kWrite) + " by item", "document of docuvend:p/i", "write file:///storage/moved.txt by newer", "end"));
  }
}

TEST_F(ConsumerCoordinationTest, NewTokensAreAskedForOnceAndOnlyWithAString) {
  script_.accessError = badToken();
  startServices();
  Document old = document();
  EXPECT_EQ(std::get<QXError>(patient().coordinateReading(old)), *script_.accessError);
  EXPECT_THAT(calls_.all(), SizeIs(1));
  old.bookmarkableString = "docuvend:p/i";
  EXPECT_EQ(std::get<QXError>(consumer_->coordinateReading(old)), *script_.accessError);
  EXPECT_THAT(calls_.all(), SizeIs(4));
}

TEST_F(ConsumerCoordinationTest, ADocumentThatIsNotToBeHadAtOnceIsNotAskedForAnew) {
  script_.accessError = coordinationError(FileCoordinationErrorCode::wouldDeadlock);
  startServices();
  Document letter = document();
  letter.bookmarkableString = "docuvend:p/i";
  EXPECT_EQ(std::get<QXError>(patient().coordinateWriting(letter)), *script_.accessError);
  EXPECT_THAT(calls_.all(), SizeIs(1));
}

// Parties.

TEST_F(ConsumerCoordinationTest, AThreadIsOnePartyAndEachThreadIsAnother) {
  startServices();
  patient();
  std::set<std::int64_t> parties;
  // One after another, so that numbers could be used again.
  constexpr std::size_t kThreads = 5;
  for (std::size_t i = 0; i < kThreads; ++i) {
    std::thread([this] {
      const auto outer = taken(consumer_->coordinateReading(url()));
      const auto inner = taken(consumer_->coordinateWriting(url()));
    }).join();
    const auto outer = names_.asked.take();
    const auto inner = names_.asked.take();
    ASSERT_TRUE(outer && inner);
    EXPECT_EQ(outer->party, inner->party);
    parties.insert(outer->party);
  }
  EXPECT_THAT(parties, SizeIs(kThreads));
  EXPECT_EQ(parties.count(0), 0U) << "it stands for callers that name none";
}

// Ending.

TEST_F(ConsumerCoordinationTest, DroppingAnAccessEndsItAndWaitsForItsEnd) {
  startServices();
  holdEnds();
  auto reading = std::make_unique<CoordinatedAccess>(taken(patient().coordinateReading(url())));
  std::atomic<bool> isAnswered = false;
  auto wasAnswered = std::async(std::launch::async, [&reading, &isAnswered] {
    reading.reset();
    return isAnswered.load();
  });
  const auto reply = ended_.take();
  ASSERT_TRUE(reply);
  EXPECT_EQ(names_.ended.take(), names_.asked.take()->accessID);
  // One that does not wait goes on while others are asked and answered.
  constexpr int kOthers = 100;
  for (int i = 0; i < kOthers; ++i) EXPECT_EQ(errorIn(consumer_->holders(url())), std::nullopt);
  isAnswered = true;
  (*reply)(std::nullopt);
  EXPECT_TRUE(wasAnswered.get());
}

TEST_F(ConsumerCoordinationTest, TheEndIsWaitedForNoLongerThanTheOrdinaryDeadline) {
  startServices();
  holdEnds();
  Consumer::Options options;
  options.deadline = 1ms;
  options.materialisingDeadline = kNever;
  auto access = taken(consumer(options).coordinateReading(url()));
  EXPECT_EQ(errorIn(access.end()), own(ConsumerErrorCode::deadlinePassed));
  { const auto dropped = taken(consumer_->coordinateReading(url())); }
  eventually("both ends have come", [this] { return count("end") == 2; });
}

TEST_F(ConsumerCoordinationTest, AnAccessEndsOnce) {
  startServices();
  {
    auto access = taken(patient().coordinateReading(url()));
    EXPECT_EQ(access.end(), std::nullopt);
    EXPECT_EQ(access.end(), std::nullopt);
  }
  EXPECT_EQ(count("end"), 1U);
}

TEST_F(ConsumerCoordinationTest, WhatBecameOfTheEndIsTold) {
  startServices();
  auto access = taken(patient().coordinateWriting(url()));
  script_.endError = coordinationError(FileCoordinationErrorCode::invalidAccessID);
  EXPECT_EQ(access.end(), script_.endError);
}

TEST_F(ConsumerCoordinationTest, AnEndForWhichThereIsNoRoomIsTriedAgain) {
  startServices();
  auto access = taken(patient().coordinateWriting(url()));
  script_.ending = [this](QXFileCoordination::ErrorReply reply) { reply(count("end") < 3 ? std::optional(noRoom()) : std::nullopt); };
  EXPECT_EQ(access.end(), std::nullopt);
  EXPECT_EQ(count("end"), 3U);
}

TEST_F(ConsumerCoordinationTest, AnEndForWhichThereIsNoRoomForLongEndsTheConnection) {
  startServices();
  auto access = taken(patient().coordinateWriting(url()));
  const auto other = taken(consumer_->coordinateReading(url()));
  script_.endError = noRoom();
  EXPECT_EQ(access.end(), noRoom());
  eventually("what was taken over the connection has ended with it", [&other] { return !other.isHeld(); });
}

TEST_F(ConsumerCoordinationTest, AnAccessMovesWithItsEnd) {
  static_assert(!std::is_copy_constructible_v<CoordinatedAccess> && !std::is_copy_assignable_v<CoordinatedAccess>);
  startServices();
  auto first = taken(patient().coordinateReading(url()));
  auto second = taken(consumer_->coordinateWriting(*QXURL::fromString("file:///other")));
  const QXUUID firstName = names_.asked.take()->accessID;
  const QXUUID secondName = names_.asked.take()->accessID;
  {
    CoordinatedAccess moved(std::move(first));
    EXPECT_FALSE(first.isHeld());
    EXPECT_EQ(first.end(), std::nullopt);
    EXPECT_EQ(count("end"), 0U);
    EXPECT_TRUE(moved.isHeld());
    moved = std::move(second);
    EXPECT_EQ(names_.ended.take(), firstName) << "it held that one before";
    EXPECT_FALSE(second.isHeld());
    EXPECT_TRUE(moved.isHeld());
    EXPECT_EQ(moved.url().absoluteString(), "file:///other");
    CoordinatedAccess& itself = moved;
    moved = std::move(itself);
    EXPECT_TRUE(moved.isHeld());
    EXPECT_EQ(count("end"), 1U);
  }
  EXPECT_EQ(names_.ended.take(), secondName);
  EXPECT_EQ(count("end"), 2U);
}

TEST_F(ConsumerCoordinationTest, AnAccessOutlivesItsConsumer) {
  startServices();
  auto access = taken(patient().coordinateReading(url()));
  consumer_.reset();
  EXPECT_TRUE(access.isHeld());
  EXPECT_EQ(access.end(), std::nullopt);
  EXPECT_EQ(count("end"), 1U);
}

TEST_F(ConsumerCoordinationTest, NestedAccessesEndEachForItself) {
  startServices();
  auto outer = taken(patient().coordinateReading(url()));
  {
    const auto inner = taken(consumer_->coordinateReading(url()));
    EXPECT_TRUE(inner.isHeld());
  }
  EXPECT_TRUE(outer.isHeld());
  EXPECT_NE(names_.ended.take(), names_.asked.take()->accessID);
  EXPECT_EQ(outer.end(), std::nullopt);
  EXPECT_EQ(coordination_->declared().size(), 1U);
}

// Deadlines.

TEST_F(ConsumerCoordinationTest, AWaitWhoseDeadlinePassesIsGivenUpOverTheSameConnection) {
  startServices();
  holdAccesses();
  EXPECT_EQ(errorIn(patient().within(20ms).coordinateWriting(url())), own(ConsumerErrorCode::deadlinePassed));
  const auto ended = names_.ended.take();
  EXPECT_EQ(ended, names_.asked.take()->accessID);
  EXPECT_EQ(coordination_->declared().size(), 1U);
}

TEST_F(ConsumerCoordinationTest, GivingUpWaitsForNothing) {
  startServices();
  holdAccesses();
  holdEnds();
  EXPECT_EQ(errorIn(patient().within(1ms).coordinateReading(url())), own(ConsumerErrorCode::deadlinePassed));
  EXPECT_TRUE(ended_.take());
}

TEST_F(ConsumerCoordinationTest, AGrantThatCrossesTheCancellationIsEnded) {
  startServices();
  holdAccesses();
  // As the service does it: the end of an access that has begun meanwhile is an end like others.
  script_.ending = [this](const QXFileCoordination::ErrorReply& reply) {
    const auto begun = begun_.take();
    (*begun)(std::nullopt);
    reply(std::nullopt);
  };
  EXPECT_EQ(errorIn(patient().within(20ms).coordinateReading(url())), own(ConsumerErrorCode::deadlinePassed));
  EXPECT_EQ(names_.ended.take(), names_.asked.take()->accessID);
  script_.accessing = nullptr;
  script_.ending = nullptr;
  EXPECT_EQ(errorIn(consumer_->coordinateReading(url())), std::nullopt) << "the late grant is nobody else's";
}

TEST_F(ConsumerCoordinationTest, AConnectionThatCarriesOnlyCancelledWaitsStaysUsable) {
  startServices();
  patient();
  holdAccesses();
  script_.ending = [this](const QXFileCoordination::ErrorReply& reply) {
    const auto begun = begun_.take();
    (*begun)(coordinationError(FileCoordinationErrorCode::ended));
    reply(std::nullopt);
  };
  // More than may be unanswered at once.
  constexpr int kWaits = 2'000;
  for (int i = 0; i < kWaits; ++i) {
    ASSERT_EQ(errorIn(consumer_->within(0ms).coordinateReading(url())), own(ConsumerErrorCode::deadlinePassed)) << i;
    ASSERT_TRUE(names_.ended.take()) << "every one is ended";
    // Behind all earlier answers.
    ASSERT_EQ(errorIn(consumer_->holders(url())), std::nullopt);
  }
  script_.accessing = nullptr;
  script_.ending = nullptr;
  EXPECT_EQ(errorIn(consumer_->coordinateReading(url())), std::nullopt);
  EXPECT_EQ(coordination_->declared().size(), 1U);
}

TEST_F(ConsumerCoordinationTest, AServiceThatAnswersNoMoreIsLeftAndAnAccessOverItStaysHeld) {
  startServices();
  auto held = taken(patient().coordinateReading(url()));
  script_.accessing = [](const QXFileCoordination::ErrorReply&) {};
  script_.ending = [](const QXFileCoordination::ErrorReply&) {};
  constexpr int kWaits = 1'000;
  for (int i = 0; i < kWaits; ++i) {
    ASSERT_EQ(errorIn(consumer_->within(0ms).coordinateReading(url())), own(ConsumerErrorCode::deadlinePassed)) << i;
  }
  script_.accessing = nullptr;
  script_.ending = nullptr;
  EXPECT_EQ(errorIn(consumer_->coordinateReading(url())), std::nullopt);
  EXPECT_GT(coordination_->declared().size(), 1U);
  EXPECT_TRUE(held.isHeld());
  EXPECT_EQ(held.end(), std::nullopt);
}

TEST_F(ConsumerCoordinationTest, TheDeadlineIsThatOfMaterialising) {
  startServices();
  holdAccesses();
  holdWakings();
  Consumer::Options options;
  options.deadline = 1ms;
  options.materialisingDeadline = kNever;
  consumer(options);
  auto waiting = std::async(std::launch::async, [this] { return consumer_->coordinateReading(url()); });
  const auto reply = begun_.take();
  ASSERT_TRUE(reply);
  EXPECT_EQ(errorIn(consumer_->wakeUp()), own(ConsumerErrorCode::deadlinePassed)) << "that much time has passed for the other call, too";
  (*reply)(std::nullopt);
  EXPECT_EQ(errorIn(waiting.get()), std::nullopt);
}

// Progress.

TEST_F(ConsumerCoordinationTest, ProgressIsAskedOfTheServiceAndToldOnTheCallingThread) {
  script_.bytesPresent = 3;
  script_.size = 10;
  startServices();
  holdAccesses();
  std::vector<Progress> told;
  const auto thread = std::this_thread::get_id();
  const auto access = patient().coordinateReading(url(), {.progress = [&](const Progress& progress) {
                                                    EXPECT_EQ(std::this_thread::get_id(), thread);
                                                    told.push_back(progress);
                                                    if (told.size() < 2) return;
                                                    if (const auto reply = begun_.take()) (*reply)(std::nullopt);
                                                  }});
  EXPECT_EQ(errorIn(access), std::nullopt);
  ASSERT_THAT(told, SizeIs(2));
  EXPECT_EQ(told[0].bytesPresent, 3U);
  EXPECT_EQ(told[0].size, 10U);
  EXPECT_EQ(count("progress"), 2U);
}

TEST_F(ConsumerCoordinationTest, WhatCannotBeSaidIsNotTold) {
  struct Case {
    std::optional<QXError> error;
    std::optional<std::int64_t> bytesPresent;
    std::optional<std::int64_t> size;
  };
  startServices();
  patient();
  for (const Case& unsaid : {Case{{}, {}, {}}, Case{{}, 1, {}}, Case{{}, {}, 1}, Case{{}, -1, 1}, Case{{}, 1, -1},
                             Case{coordinationError(FileCoordinationErrorCode::invalidAccessID), 1, 1}}) {
    script_.progressError = unsaid.error;
    script_.bytesPresent = unsaid.bytesPresent;
    script_.size = unsaid.size;
    holdAccesses();
    const std::size_t before = count("progress");
    auto answering = std::async(std::launch::async, [this, before] {
      const auto reply = begun_.take();
      eventually("progress has been asked for twice", [this, before] { return count("progress") >= before + 2; });
      (*reply)(std::nullopt);
    });
    EXPECT_EQ(errorIn(consumer_->coordinateReading(url(), {.progress = [](const Progress&) { ADD_FAILURE() << "of what?"; }})),
              std::nullopt);
    answering.get();
  }
}

// Restarts.

TEST_F(ConsumerCoordinationTest, AnAccessEndsWithItsDaemonAndSaysSo) {
  startServices();
  auto access = taken(patient().coordinateWriting(url()));
  auto dropped = taken(consumer_->coordinateReading(url()));
  stopServices();
  eventually("the end is known", [&access] { return !access.isHeld(); });
  const Failure failure = access.end();
  EXPECT_EQ(errorIn(failure), own(ConsumerErrorCode::connectionLost));
  EXPECT_TRUE(failure && failure->underlying);
}

TEST_F(ConsumerCoordinationTest, ADaemonThatEndsBeforeTheEndIsAnsweredIsLostToo) {
  startServices();
  auto access = taken(patient().coordinateWriting(url()));
  script_.ending = [this](const QXFileCoordination::ErrorReply&) { coordination_->endConnections(); };
  EXPECT_EQ(errorIn(access.end()), own(ConsumerErrorCode::connectionLost));
  EXPECT_EQ(count("end"), 1U) << "it is not said to the next daemon, which does not know the access";
}

TEST_F(ConsumerCoordinationTest, AnAccessThatWasAskedForWhenTheDaemonEndedIsAskedForOnceMore) {
  startServices();
  int requests = 0;
  script_.accessing = [this, &requests](const QXFileCoordination::ErrorReply& reply) {
    if (++requests == 1) return coordination_->endConnections();
    reply(std::nullopt);
  };
  auto access = taken(patient().coordinateReading(url()));
  EXPECT_EQ(requests, 2);
  EXPECT_TRUE(access.isHeld()) << "it is of the connection over which it was answered";
  EXPECT_EQ(access.end(), std::nullopt);
}

TEST_F(ConsumerCoordinationTest, TheNextAccessIsTheNextDaemons) {
  startServices();
  auto old = taken(patient().coordinateReading(url()));
  stopServices();
  startServices();
  auto access = taken(consumer_->coordinateReading(url()));
  EXPECT_TRUE(access.isHeld());
  EXPECT_EQ(errorIn(old.end()), own(ConsumerErrorCode::connectionLost));
  EXPECT_EQ(access.end(), std::nullopt);
}

// Holders.

TEST_F(ConsumerCoordinationTest, HoldersAreToldInTheirOrder) {
  script_.holders = QXArray{
      QXDictionary{
          {"kind", "writing"}, {"state", "holding"}, {"own", true}, {"processIdentifier", 17}, {"bundleIdentifier", "com.example.app"}},
      QXDictionary{{"kind", "reading"}, {"state", "providing"}, {"own", false}},
      QXDictionary{{"kind", "reading"}, {"state", "waiting"}, {"own", false}, {"added later", 1}}};
  startServices();
  const auto holders = patient().holders(url(), QXData::fromText("key"));
  ASSERT_EQ(errorIn(holders), std::nullopt);
  EXPECT_THAT(std::get<0>(holders),
              ElementsAre(FileHolder{CoordinationKind::writing, FileHolder::State::holding, true, 17, ConsumerID{"com.example.app"}},
                          FileHolder{CoordinationKind::reading, FileHolder::State::providing, false, {}, {}},
                          FileHolder{CoordinationKind::reading, FileHolder::State::waiting, false, {}, {}}));
  script_.holders = QXArray{};
  const auto none = consumer_->holders(url());
  ASSERT_EQ(errorIn(none), std::nullopt);
  EXPECT_THAT(std::get<0>(none), IsEmpty());
  EXPECT_THAT(calls_.all(), ElementsAre("holders of file:///storage/letter.txt by key", "holders of file:///storage/letter.txt"));
}

TEST_F(ConsumerCoordinationTest, AnAnswerThatDoesNotTellOfHoldersIsAnError) {
  startServices();
  patient();
  for (const QXValue& entry :
       {QXValue("text"), QXValue(QXDictionary{{"state", "holding"}, {"own", true}}),
        QXValue(QXDictionary{{"kind", "reading"}, {"own", true}}), QXValue(QXDictionary{{"kind", "reading"}, {"state", "holding"}}),
        QXValue(QXDictionary{{"kind", "dancing"}, {"state", "holding"}, {"own", true}}),
        QXValue(QXDictionary{{"kind", "reading"}, {"state", "dancing"}, {"own", true}})}) {
    script_.holders = QXArray{entry};
    EXPECT_EQ(errorIn(consumer_->holders(url())), own(ConsumerErrorCode::noAnswer)) << entry.description();
  }
  script_.holders.reset();
  EXPECT_EQ(errorIn(consumer_->holders(url())), own(ConsumerErrorCode::noAnswer));
  script_.error = coordinationError(FileCoordinationErrorCode::notPermitted);
  EXPECT_EQ(std::get<QXError>(consumer_->holders(url())), *script_.error);
}

}  // namespace
}  // namespace docuvend::tests
