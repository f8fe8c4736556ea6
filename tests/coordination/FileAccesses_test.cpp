#include "platform/linux/coordination/FileAccesses.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/fake/FakeFileSystem.h"
#include "platform/fake/FakeQueues.h"
#include "platform/linux/base/LogSubject.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "tests/coordination/RecordingProvider.h"
#include "tests/coordination/Turns.h"

namespace docuvend::linux_platform {
namespace {

using testing::fileNamed;
using testing::partyOf;
using testing::processNumber;
using testing::RecordingProvider;

using Events = std::vector<std::string>;

const char* nameOf(AccessState state) {
  switch (state) {
    case AccessState::waiting:
      return "waiting";
    case AccessState::providing:
      return "providing";
    case AccessState::holding:
      break;
  }
  return "holding";
}

// Lets something happen while a file is looked for in a provider's directory.
class InterruptedFileSystem final : public fake_platform::FakeFileSystem {
 public:
  RelationshipAnswer relationship(const QXURL& directory, const QXURL& item) override {
    if (const auto interruption = std::exchange(onNextLook, {})) interruption();
    return FakeFileSystem::relationship(directory, item);
  }
  std::function<void()> onNextLook;
};

struct FileAccessesTest : ::testing::Test {
  void SetUp() override {
    fileSystem.addDirectory("/storage");
    fileSystem.addDirectory("/other");
    coordinator._addDocuvend(provider);
    provider->onAsked = [this] { events.push_back("asked for " + provider->asked.back().url.fileSystemPath()); };
    provider->onTold = [this] { events.push_back("told of " + provider->told.back().second.fileSystemPath()); };
  }

  FileAccess access(const std::string& path, AccessKind kind, const AccessParty& party) {
    const int process = 100 + party.process.bytes[0];
    return {fileNamed(path), QXURL::fileURL(path, QXURLKind::file), kind, party, {process, "com.example." + std::to_string(process)}};
  }
  AccessNumber begin(FileAccess access) {
    const AccessNumber number = accesses.newNumber();
    accesses.begin(number, std::move(access), [this, number](std::optional<QXError> error) {
      events.push_back(std::to_string(number) + (error ? " failed: " + error->description() : " begun"));
    });
    return number;
  }
  AccessNumber read(const std::string& path, const AccessParty& party) { return begin(access(path, AccessKind::reading, party)); }
  AccessNumber write(const std::string& path, const AccessParty& party) { return begin(access(path, AccessKind::writing, party)); }
  void end(AccessNumber number) {
    accesses.end(number, [this, number] { events.push_back(std::to_string(number) + " ended"); });
  }
  // What has happened since it was last looked at.
  Events news() { return std::exchange(events, {}); }
  std::string state(AccessNumber number) const {
    const auto state = accesses.stateOf(number);
    return state ? nameOf(*state) : "over";
  }
  void answer(std::size_t question, std::optional<QXError> error = {}) {
    const auto completion = provider->asked.at(question).completion;
    completion(std::move(error));
  }

  const std::string item = "/storage/item";
  const std::string elsewhere = "/other/item";
  const AccessParty a = partyOf(1);
  const AccessParty b = partyOf(2);
  const AccessParty c = partyOf(3);
  const AccessParty d = partyOf(4);
  const QXError broken = QXError::make("CloudDomain", 3, "the cloud is away");
  const std::string brokenText = " failed: " + broken.description();
  Events events;
  fake_platform::FakeQueues queues;
  InterruptedFileSystem fileSystem;
  LinuxFileCoordinator coordinator{fileSystem};
  const std::shared_ptr<RecordingProvider> provider = std::make_shared<RecordingProvider>(QXURL::fileURL("/storage", QXURLKind::directory));
  FileAccesses accesses{coordinator};
};

// ---- reading

TEST_F(FileAccessesTest, BeginsAReadOfNobodysFileAtOnce) {
  const AccessNumber reader = read(elsewhere, a);
  EXPECT_EQ(news(), Events{"1 begun"});
  EXPECT_EQ(state(reader), "holding");
  end(reader);
  EXPECT_EQ(news(), Events{"1 ended"});
  EXPECT_EQ(state(reader), "over");
}

TEST_F(FileAccessesTest, BeginsAReadBelowAProvidersDirectoryWhenTheContentsAreThere) {
  const AccessNumber reader = read(item, a);
  EXPECT_EQ(news(), Events{"asked for /storage/item"});
  EXPECT_EQ(provider->asked[0].reader, "reader 101-1");
  EXPECT_EQ(state(reader), "providing");
  answer(0);
  EXPECT_EQ(news(), Events{"1 begun"});
  EXPECT_EQ(state(reader), "holding");
  end(reader);
  EXPECT_EQ(news(), Events{"1 ended"}) << "of a read nobody is told";
}

TEST_F(FileAccessesTest, AsksForNothingWhenTheProvidersDirectoryItselfIsRead) {
  read("/storage", a);
  EXPECT_EQ(news(), Events{"1 begun"});
}

TEST_F(FileAccessesTest, TakesAnAnswerThatComesInsideTheQuestion) {
  provider->onAsked = [this] { answer(provider->asked.size() - 1); };
  read(item, a);
  EXPECT_EQ(news(), Events{"1 begun"});
  provider->onAsked = [this] { answer(provider->asked.size() - 1, broken); };
  read(item, b);
  EXPECT_EQ(news(), Events{"2" + brokenText});
}

TEST_F(FileAccessesTest, AsksTheProviderOnItsOwnQueue) {
  coordinator._removeDocuvend(provider);
  const auto queued = std::make_shared<RecordingProvider>(QXURL::fileURL("/storage", QXURLKind::directory), queues.operationQueue());
  coordinator._addDocuvend(queued);
  const AccessNumber reader = read(item, a);
  EXPECT_TRUE(queued->asked.empty());
  EXPECT_EQ(state(reader), "providing");
  queues.runAll();
  EXPECT_EQ(queued->asked.size(), 1U);
}

TEST_F(FileAccessesTest, HearsAProviderOnce) {
  read(item, a);
  answer(0);
  EXPECT_EQ(news(), (Events{"asked for /storage/item", "1 begun"}));
  answer(0, broken);
  EXPECT_EQ(news(), Events{});
  read(item, b);
  answer(0);
  EXPECT_EQ(news(), Events{"asked for /storage/item"}) << "the second answer to the first request answers no other";
  answer(1);
  EXPECT_EQ(news(), Events{"2 begun"});
}

TEST_F(FileAccessesTest, PassesTheProvidersErrorOnAndTheTurnToo) {
  const AccessNumber reader = read(item, a);
  const AccessNumber writer = write(item, b);
  news();
  answer(0, broken);
  EXPECT_EQ(news(), (Events{"1" + brokenText, "2 begun"}));
  EXPECT_EQ(state(reader), "over");
  EXPECT_EQ(state(writer), "holding");
  end(reader);
  EXPECT_EQ(news(), Events{"1 ended"});
}

TEST_F(FileAccessesTest, AsksOnceForAllWhoWait) {
  read(item, a);
  read(item, b);
  EXPECT_EQ(news(), Events{"asked for /storage/item"});
  read(item, c);
  EXPECT_EQ(news(), Events{}) << "also when it comes while the request runs";
  answer(0);
  EXPECT_EQ(news(), (Events{"1 begun", "2 begun", "3 begun"}));
}

TEST_F(FileAccessesTest, FailsAllWhoWaitAndAsksAnewForWhoeverComesLater) {
  read(item, a);
  read(item, b);
  news();
  answer(0, broken);
  EXPECT_EQ(news(), (Events{"1" + brokenText, "2" + brokenText}));
  read(item, a);
  EXPECT_EQ(news(), Events{"asked for /storage/item"});
  answer(1);
  EXPECT_EQ(news(), Events{"3 begun"});
}

TEST_F(FileAccessesTest, AsksAnewForAReaderWhoComesAfterTheContentsDid) {
  read(item, a);
  answer(0);
  news();
  read(item, b);
  EXPECT_EQ(news(), Events{"asked for /storage/item"}) << "they may have been taken away since";
}

TEST_F(FileAccessesTest, AsksForEveryFileByItself) {
  read(item, a);
  read("/storage/folder/second", b);
  EXPECT_EQ(news(), (Events{"asked for /storage/item", "asked for /storage/folder/second"}));
  answer(1);
  EXPECT_EQ(news(), Events{"2 begun"}) << "one that hangs holds up no other";
  EXPECT_EQ(state(1), "providing");
}

TEST_F(FileAccessesTest, AsksForAReaderWhoWaitedWhenItsTurnComes) {
  const AccessNumber writer = write(item, a);
  const AccessNumber reader = read(item, b);
  EXPECT_EQ(news(), Events{"1 begun"});
  EXPECT_EQ(state(reader), "waiting");
  end(writer);
  EXPECT_EQ(news(), (Events{"told of /storage/item", "1 ended", "asked for /storage/item"}));
  EXPECT_EQ(state(reader), "providing");
  answer(0);
  EXPECT_EQ(news(), Events{"2 begun"});
}

TEST_F(FileAccessesTest, LetsARequestGoOnForWhoeverComesBack) {
  const AccessNumber first = read(item, a);
  end(first);
  news();
  const AccessNumber second = read(item, b);
  EXPECT_EQ(news(), Events{}) << "the request still runs";
  EXPECT_EQ(state(second), "providing");
  answer(0);
  EXPECT_EQ(news(), Events{"2 begun"});
}

TEST_F(FileAccessesTest, TakesAnAnswerForWhichNobodyWaits) {
  end(read(item, a));
  news();
  answer(0);
  EXPECT_EQ(news(), Events{});
  read(item, b);
  EXPECT_EQ(news(), Events{"asked for /storage/item"});
}

TEST_F(FileAccessesTest, AsksAnObjectThatTookAnothersPlaceByItself) {
  read(item, a);
  coordinator._removeDocuvend(provider);
  const auto next = std::make_shared<RecordingProvider>(QXURL::fileURL("/storage", QXURLKind::directory));
  coordinator._addDocuvend(next);
  read(item, b);
  EXPECT_EQ(next->asked.size(), 1U);
  news();
  answer(0, broken);
  EXPECT_EQ(news(), Events{"1" + brokenText});
  next->asked.at(0).completion(/*error=*/{});
  EXPECT_EQ(news(), Events{"2 begun"});
}

TEST_F(FileAccessesTest, LetsGoOfAnObjectWithNoLockHeld) {
  coordinator._removeDocuvend(provider);
  bool isGone = false;
  std::shared_ptr<RecordingProvider> shortLived(new RecordingProvider(QXURL::fileURL("/storage", QXURLKind::directory)),
                                                [this, &isGone](RecordingProvider* object) {
                                                  isGone = accesses.of(fileNamed(item)).size() == 1;
                                                  delete object;
                                                });
  coordinator._addDocuvend(shortLived);
  read(item, a);
  const auto completion = shortLived->asked.at(0).completion;
  coordinator._removeDocuvend(shortLived);
  shortLived.reset();
  EXPECT_FALSE(isGone) << "a request keeps whom it was made to";
  completion(/*error=*/{});
  EXPECT_TRUE(isGone);
}

// ---- within a process's own access

TEST_F(FileAccessesTest, DoesNotAskAgainWithinAReadOfTheSameProcess) {
  const AccessNumber outer = read(item, a);
  answer(0);
  news();
  const AccessNumber inner = read(item, a);
  read(item, partyOf(1, 2));
  EXPECT_EQ(news(), (Events{"2 begun", "3 begun"}));
  end(outer);
  end(inner);
  news();
  read(item, a);
  EXPECT_EQ(news(), Events{"4 begun"}) << "the process still has the turn";
}

TEST_F(FileAccessesTest, AsksAgainWhenTheProcessHadNoTurnMeanwhile) {
  const AccessNumber first = read(item, a);
  answer(0);
  end(first);
  news();
  read(item, a);
  EXPECT_EQ(news(), Events{"asked for /storage/item"});
}

TEST_F(FileAccessesTest, LetsAReadWithinOneThatIsBeingProvidedWaitForTheSameRequest) {
  read(item, a);
  read(item, a);
  EXPECT_EQ(news(), Events{"asked for /storage/item"});
  answer(0);
  EXPECT_EQ(news(), (Events{"1 begun", "2 begun"}));
}

TEST_F(FileAccessesTest, AsksOnceWithinAWriteOfTheSameProcess) {
  write(item, a);
  EXPECT_EQ(news(), Events{"1 begun"}) << "a write needs no contents";
  const AccessNumber inner = read(item, a);
  EXPECT_EQ(news(), Events{"asked for /storage/item"});
  answer(0);
  EXPECT_EQ(news(), Events{"2 begun"});
  end(inner);
  news();
  read(item, a);
  EXPECT_EQ(news(), Events{"3 begun"});
}

TEST_F(FileAccessesTest, AsksAgainWithinAWriteWhenTheRequestHasFailed) {
  write(item, a);
  read(item, a);
  answer(0, broken);
  EXPECT_EQ(news(), (Events{"1 begun", "asked for /storage/item", "2" + brokenText}));
  read(item, a);
  EXPECT_EQ(news(), Events{"asked for /storage/item"});
}

TEST_F(FileAccessesTest, RemembersARequestWhoseReaderHasLeftForTheProcessThatStillHasTheTurn) {
  write(item, a);
  end(read(item, a));
  answer(0);
  news();
  read(item, a);
  EXPECT_EQ(news(), Events{"3 begun"});
}

TEST_F(FileAccessesTest, ForgetsARequestWhoseProcessHasNoTurnAnyMore) {
  end(read(item, a));
  answer(0);
  const AccessNumber writer = write(item, a);
  news();
  read(item, a);
  EXPECT_EQ(news(), Events{"asked for /storage/item"}) << "the turn is another one";
  end(writer);
}

// ---- limits

TEST_F(FileAccessesTest, LetsOneApplicationHaveALimitedNumberOfAccessesOverAllItsProcesses) {
  const auto of = [this](const std::string& name, const std::optional<std::string>& application, std::uint8_t process) {
    FileAccess made = access("/other/" + name, AccessKind::reading, partyOf(process));
    made.holder.bundleIdentifier = application;
    return begin(made);
  };
  const auto last = [this] { return news().back(); };
  for (const auto& [application, most] :
       {std::pair(std::optional<std::string>("com.example.many"), FileAccesses::kMaximumAccessesOfApplication),
        std::pair(std::optional<std::string>(), FileAccesses::kMaximumUnconfinedAccesses)}) {
    AccessNumber number = 0;
    for (std::size_t i = 0; i < most; ++i) {
      number = of(std::to_string(i), application, static_cast<std::uint8_t>(1 + i % 4));
      ASSERT_EQ(last(), std::to_string(number) + " begun");
    }
    const AccessNumber refused = of("one more", application, 5);
    EXPECT_THAT(last(), ::testing::StartsWith(std::to_string(refused) + " failed: QXFileCoordinationErrorDomain 7"));
    EXPECT_EQ(state(refused), "over");
    EXPECT_EQ(state(begin(access("/other/one more", AccessKind::writing, d))), "holding") << "another application, and nobody before it";
    end(number);
    EXPECT_EQ(state(of("one more again", application, 5)), "holding");
  }
}

TEST_F(FileAccessesTest, AskALimitedNumberOfFilesAtATimeForOneApplicationThoughReadsAreGivenUp) {
  constexpr std::size_t kMost = Provisions::kMaximumRequestsUnderWay;
  const auto file = [](std::size_t number) { return "/storage/" + std::to_string(number); };
  for (std::size_t i = 0; i < kMost + 100; ++i) end(read(file(i), a));
  EXPECT_EQ(provider->asked.size(), kMost) << "those that are given up go on, and no more are asked for";
  const AccessNumber reader = read(file(1000), a);
  const AccessNumber next = read(file(1001), a);
  EXPECT_EQ(provider->asked.size(), kMost);
  EXPECT_EQ(state(reader), "providing");
  read(file(2000), b);
  EXPECT_EQ(provider->asked.size(), kMost + 1) << "another application is not concerned";
  answer(3);
  ASSERT_EQ(provider->asked.size(), kMost + 2);
  EXPECT_EQ(provider->asked.back().url.fileSystemPath(), file(1000));
  EXPECT_EQ(provider->asked.back().reader.substr(0, 11), "reader 101-");
  answer(4, broken);
  EXPECT_EQ(provider->asked.size(), kMost + 3);
  news();
  answer(kMost + 1);
  answer(kMost + 2, broken);
  EXPECT_EQ(news(), (Events{std::to_string(reader) + " begun", std::to_string(next) + brokenText}));
}

TEST_F(FileAccessesTest, AskWhoeverHasReplacedAProviderForThoseWhoWaitedUntilTheyMightAsk) {
  for (std::size_t i = 0; i <= Provisions::kMaximumRequestsUnderWay; ++i) read("/storage/" + std::to_string(i), a);
  const auto next = std::make_shared<RecordingProvider>(QXURL::fileURL("/storage", QXURLKind::directory));
  coordinator._addDocuvend(next);
  EXPECT_TRUE(next->asked.empty());
  coordinator._removeDocuvend(provider);
  ASSERT_EQ(next->asked.size(), 1U);
  EXPECT_EQ(next->asked[0].url.fileSystemPath(), "/storage/" + std::to_string(Provisions::kMaximumRequestsUnderWay));
  for (std::size_t i = 0; i < Provisions::kMaximumRequestsUnderWay; ++i) answer(i);
  EXPECT_EQ(provider->asked.size(), Provisions::kMaximumRequestsUnderWay);
}

TEST_F(FileAccessesTest, AskWhoeverHasReplacedAProviderAlsoWhenThatWasBetweenTheLookAndTheWait) {
  for (std::size_t i = 0; i < Provisions::kMaximumRequestsUnderWay; ++i) read("/storage/" + std::to_string(i), a);
  const auto next = std::make_shared<RecordingProvider>(QXURL::fileURL("/storage", QXURLKind::directory));
  fileSystem.onNextLook = [this, &next] {
    coordinator._removeDocuvend(provider);
    coordinator._addDocuvend(next);
  };
  read(item, a);
  EXPECT_EQ(next->asked.size(), 1U);
}

// ---- writing

TEST_F(FileAccessesTest, TellsTheProviderOnceThenPassesTheTurnOnThenAnswers) {
  const AccessNumber writer = write(item, a);
  write(item, b);
  EXPECT_EQ(news(), Events{"1 begun"});
  end(writer);
  EXPECT_EQ(news(), (Events{"told of /storage/item", "2 begun", "1 ended"}));
  ASSERT_EQ(provider->told.size(), 1U);
  EXPECT_EQ(provider->told[0].first, "writer 101-1");
  end(writer);
  EXPECT_EQ(news(), Events{"1 ended"});
}

TEST_F(FileAccessesTest, KeepsTheTurnUntilTheProviderHasBeenTold) {
  coordinator._removeDocuvend(provider);
  const auto queued = std::make_shared<RecordingProvider>(QXURL::fileURL("/storage", QXURLKind::directory), queues.operationQueue());
  coordinator._addDocuvend(queued);
  const AccessNumber writer = write(item, a);
  const AccessNumber next = write(item, b);
  news();
  end(writer);
  EXPECT_EQ(news(), Events{});
  EXPECT_EQ(state(writer), "holding");
  EXPECT_EQ(state(next), "waiting");
  end(writer);
  EXPECT_EQ(news(), Events{"1 ended"}) << "a second end has nothing to wait for";
  const AccessNumber other = write(elsewhere, c);
  end(other);
  EXPECT_EQ(news(), (Events{"3 begun", "3 ended"})) << "who is slow to hear holds up no end elsewhere";
  queues.runAll();
  EXPECT_EQ(queued->told.size(), 1U);
  EXPECT_EQ(news(), (Events{"2 begun", "1 ended"}));
}

TEST_F(FileAccessesTest, TellsNobodyOfAWriteOutsideEveryProvidersDirectory) {
  const AccessNumber writer = write(elsewhere, a);
  write(elsewhere, b);
  end(writer);
  EXPECT_EQ(news(), (Events{"1 begun", "2 begun", "1 ended"}));
}

TEST_F(FileAccessesTest, TellsWhoProvidesTheFileWhenTheWriteEnds) {
  coordinator._removeDocuvend(provider);
  const AccessNumber first = write(item, a);
  coordinator._addDocuvend(provider);
  end(first);
  EXPECT_EQ(news(), (Events{"1 begun", "told of /storage/item", "1 ended"}));
  const AccessNumber second = write(item, a);
  coordinator._removeDocuvend(provider);
  end(second);
  EXPECT_EQ(news(), (Events{"2 begun", "2 ended"}));
}

TEST_F(FileAccessesTest, LeavesTheDirectoryItselfToTheProvider) {
  end(write("/storage", a));
  EXPECT_EQ(news(), (Events{"1 begun", "told of /storage", "1 ended"}));
}

TEST_F(FileAccessesTest, TellsOfEveryWriteWithinAWrite) {
  const AccessNumber outer = write(item, a);
  end(write(item, a));
  EXPECT_EQ(news(), (Events{"1 begun", "2 begun", "told of /storage/item", "2 ended"}));
  end(outer);
  EXPECT_EQ(news(), (Events{"told of /storage/item", "1 ended"}));
  EXPECT_EQ(provider->told[1].first, "writer 101-2");
}

// ---- ends before the beginning

std::string endedText(const std::string& path) {
  QXError error = QXError::make(kQXFileCoordinationErrorDomain, static_cast<std::int64_t>(FileCoordinationErrorCode::ended),
                                "the access was ended before it had begun");
  error.url = QXURL::fileURL(path, QXURLKind::file);
  return " failed: " + error.description();
}

TEST_F(FileAccessesTest, AnswersAWriteThatEndsBeforeItsTurnAndTellsNobody) {
  write(item, a);
  const AccessNumber waiting = write(item, b);
  news();
  end(waiting);
  EXPECT_EQ(news(), (Events{"2" + endedText(item), "2 ended"}));
  EXPECT_EQ(state(waiting), "over");
  EXPECT_TRUE(provider->told.empty());
}

TEST_F(FileAccessesTest, AnswersAReadThatEndsBeforeItsContentsAreThere) {
  const AccessNumber reader = read(item, a);
  write(item, b);
  news();
  end(reader);
  EXPECT_EQ(news(), (Events{"1" + endedText(item), "2 begun", "1 ended"}));
  answer(0);
  EXPECT_EQ(news(), Events{});
}

TEST_F(FileAccessesTest, AsksNobodyForAReaderWhoEndsWhileItsProviderIsLookedFor) {
  for (const std::string& path : {item, elsewhere}) {
    fileSystem.onNextLook = [this] { end(accesses.newNumber() - 1); };
    const AccessNumber reader = read(path, a);
    const std::string number = std::to_string(reader);
    EXPECT_EQ(news(), (Events{number + endedText(path), number + " ended"}));
    EXPECT_EQ(state(reader), "over");
  }
  EXPECT_TRUE(provider->asked.empty());
}

TEST_F(FileAccessesTest, LetsThoseBehindGoOnWhenOneThatWaitsEnds) {
  read(elsewhere, a);
  const AccessNumber waiting = write(elsewhere, b);
  read(elsewhere, c);
  news();
  end(waiting);
  EXPECT_EQ(news(), (Events{"2" + endedText(elsewhere), "2 ended", "3 begun"})) << "no end waits until a provider is found";
}

TEST_F(FileAccessesTest, EndsAtOnceWhatItDoesNotKnow) {
  end(77);
  EXPECT_EQ(news(), Events{"77 ended"});
  EXPECT_EQ(state(77), "over");
}

TEST_F(FileAccessesTest, RefusesAWaitWithoutAnEnd) {
  write(elsewhere, a);
  write(item, b);
  write(item, a);
  news();
  const AccessNumber refused = write(elsewhere, b);
  QXError error = QXError::make(kQXFileCoordinationErrorDomain, static_cast<std::int64_t>(FileCoordinationErrorCode::wouldDeadlock),
                                "the wait would never end: those who are waited for wait for the caller themselves");
  error.url = QXURL::fileURL(elsewhere, QXURLKind::file);
  EXPECT_EQ(news(), Events{"4 failed: " + error.description()});
  EXPECT_EQ(state(refused), "over");
  end(refused);
  EXPECT_EQ(news(), Events{"4 ended"});
}

// ---- what can be asked

TEST_F(FileAccessesTest, NamesThoseThatHaveAFileAndThoseThatWaitForIt) {
  read(item, a);
  answer(0);
  read(item, b);
  write(item, c);
  read(item, d);
  const auto known = accesses.of(fileNamed(item));
  ASSERT_EQ(known.size(), 4U);
  const Events states = {"holding", "providing", "waiting", "waiting"};
  for (std::size_t i = 0; i < known.size(); ++i) {
    EXPECT_EQ(nameOf(known[i].state), states[i]);
    EXPECT_EQ(known[i].access.holder.processIdentifier, 101 + static_cast<int>(i));
  }
  EXPECT_EQ(known[2].access.kind, AccessKind::writing);
  EXPECT_EQ(known[3].access.holder.bundleIdentifier, "com.example.104");
  EXPECT_TRUE(accesses.of(fileNamed(elsewhere)).empty());
  EXPECT_EQ(accesses.of(fileNamed(item), /*most=*/2).size(), 2U);
}

TEST_F(FileAccessesTest, KnowsWhichProcessWrites) {
  const AccessNumber writer = write(item, a);
  write(item, b);
  EXPECT_TRUE(accesses.isWriting(processNumber(1), fileNamed(item)));
  EXPECT_FALSE(accesses.isWriting(processNumber(2), fileNamed(item)));
  EXPECT_FALSE(accesses.isWriting(processNumber(1), fileNamed(elsewhere)));
  end(writer);
  EXPECT_FALSE(accesses.isWriting(processNumber(1), fileNamed(item)));
}

TEST_F(FileAccessesTest, AWriteWhoseEndIsBeingToldOfTellsOfNothingThatComesLater) {
  bool wasWriting = true;
  provider->onTold = [this, &wasWriting] { wasWriting = accesses.isWriting(processNumber(1), fileNamed(item)); };
  end(write(item, a));
  EXPECT_FALSE(wasWriting);
}

TEST_F(FileAccessesTest, HoldsNoLockWhileItAnswersAsksAndTells) {
  const auto look = [this] { return accesses.of(fileNamed(item)).size(); };
  std::vector<std::size_t> seen;
  provider->onAsked = [this, &seen, &look] {
    seen.push_back(look());
    answer(0);
  };
  provider->onTold = [&seen, &look] { seen.push_back(look()); };
  const AccessNumber reader = accesses.newNumber();
  accesses.begin(reader, access(item, AccessKind::reading, a), [this, &seen, &look, reader](const std::optional<QXError>& error) {
    EXPECT_FALSE(error);
    seen.push_back(look());
    accesses.end(reader, [&seen, &look] { seen.push_back(look()); });
  });
  EXPECT_EQ(seen, (std::vector<std::size_t>{1, 1, 0}));
  end(write(item, a));
  EXPECT_EQ(seen, (std::vector<std::size_t>{1, 1, 0, 1}));
}

// So that nobody brings lines into the log that count as another's, or as nobody's: whoever ends an access may be the daemon itself, when
// a connection has gone.
TEST_F(FileAccessesTest, AsksAndTellsForTheHolderWhoeverSetsThatGoing) {
  const auto subject = [] {
    const auto name = LogSubject::current();
    return name ? *name : "nobody in particular";
  };
  provider->onAsked = [this, &subject] { events.push_back("asked for " + subject()); };
  provider->onTold = [this, &subject] { events.push_back("told for " + subject()); };
  const AccessNumber writer = write(item, a);
  read(item, b);
  FileAccess unconfined = access("/storage/other", AccessKind::reading, c);
  unconfined.holder.bundleIdentifier.reset();
  news();
  {
    const LogSubject somebodyElse(std::make_shared<const std::string>("somebody else"));
    end(writer);
    begin(unconfined);
  }
  EXPECT_EQ(news(), (Events{"told for com.example.101", "1 ended", "asked for com.example.102", "asked for nobody in particular"}));
}

TEST_F(FileAccessesTest, TakesOneWhoWantsNoAnswers) {
  const AccessNumber writer = accesses.newNumber();
  accesses.begin(writer, access(item, AccessKind::writing, a), /*answer=*/{});
  EXPECT_EQ(state(writer), "holding");
  accesses.end(writer, /*ended=*/{});
  EXPECT_EQ(state(writer), "over");
  accesses.end(writer, /*ended=*/{});
  EXPECT_EQ(news(), Events{"told of /storage/item"});
}

TEST_F(FileAccessesTest, NeverChoosesANumberTwice) {
  const AccessNumber first = accesses.newNumber();
  const AccessNumber second = accesses.newNumber();
  EXPECT_NE(first, second);
}

}  // namespace
}  // namespace docuvend::linux_platform
