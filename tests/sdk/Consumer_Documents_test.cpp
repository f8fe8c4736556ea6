#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <future>
#include <map>
#include <memory>
#include <thread>

#include "common/DVErrors.h"
#include "sdk/Consumer.h"
#include "tests/sdk/ScriptedDaemon.h"
#include "tests/support/Eventually.h"

namespace docuvend::tests {
namespace {

using linux_platform::SandboxErrorCode;
using linux_platform::UniqueDescriptor;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;
using namespace std::chrono_literals;

constexpr auto kNever = std::chrono::hours(24);

QXError sandboxError(SandboxErrorCode code) {
  return QXError::make(linux_platform::kQXSandboxErrorDomain, static_cast<std::int64_t>(code), "of a test");
}

Failure writeNew(const QXDescriptor& file) {
  return ::write(file.number, "new", 3) == 3 ? Failure() : Failure(QXError::system(errno, "cannot write"));
}

class ConsumerDocumentsTest : public ConsumerTest {
 protected:
  ConsumerDocumentsTest() {
    // A token opens the file of its name, each time anew.
    script_.redeem = [this](const std::string& token) -> std::variant<QXDescriptor, QXError> {
      UniqueDescriptor file(::open(path(token).c_str(), O_RDWR | O_CLOEXEC));
      if (!file) return sandboxError(SandboxErrorCode::gone);
      return linux_platform::toValue(std::move(file));
    };
  }

  [[nodiscard]] std::string path(const std::string& name) const { return root_ + "/" + name; }
  void put(const std::string& name, const std::string& contents) const {
    const UniqueDescriptor file(::open(path(name).c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
    ASSERT_EQ(::write(file.get(), contents.data(), contents.size()), static_cast<ssize_t>(contents.size()));
  }
  [[nodiscard]] std::string contentsOf(const std::string& name) const {
    const UniqueDescriptor file(::open(path(name).c_str(), O_RDONLY | O_CLOEXEC));
    return contentsOf(file.get());
  }
  [[nodiscard]] static std::string contentsOf(int file) {
    std::string text(100, '\0');
    const ssize_t count = ::pread(file, text.data(), text.size(), 0);
    text.resize(count < 0 ? 0 : static_cast<std::size_t>(count));
    return text;
  }
  // The next so many redemptions fail with that error, then it goes on as before.
  void failRedemptions(int count, const QXError& error) {
    script_.redeem = [count, error, redeem = script_.redeem](const std::string& token) mutable -> std::variant<QXDescriptor, QXError> {
      if (count-- > 0) return error;
      return redeem(token);
    };
  }
  [[nodiscard]] std::size_t count(const std::string& call) const {
    const auto all = calls_.all();
    return static_cast<std::size_t>(std::count(all.begin(), all.end(), call));
  }
  [[nodiscard]] bool isLocked(const std::string& name) const {
    const UniqueDescriptor file(::open(path(name).c_str(), O_RDWR | O_CLOEXEC));
    return ::flock(file.get(), LOCK_EX | LOCK_NB) != 0;
  }
};

// Opening.

TEST_F(ConsumerDocumentsTest, OpeningHasTheDocumentProvidedAndThenRedeemsItsToken) {
  put("item", "contents");
  startServices();
  const auto opened = consumer().open(document(), kProvider, Access::read);
  ASSERT_EQ(opened.index(), 0U);
  EXPECT_EQ(contentsOf(std::get<QXDescriptor>(opened).number), "contents");
  EXPECT_EQ(consumer_->open(document(), kProvider, Access::readWrite).index(), 0U);
  EXPECT_THAT(calls_.all(),
              ElementsAre("start file:///storage/letter.txt com.example.provider com.example.consumer", "redeem item for reading",
                          "start file:///storage/letter.txt com.example.provider com.example.consumer", "redeem item for writing"));
}

TEST_F(ConsumerDocumentsTest, WhatIsNotProvidedIsNotOpened) {
  script_.error = DVNotPermittedError();
  put("item", "zeros");
  startServices();
  EXPECT_EQ(std::get<QXError>(consumer().open(document(), kProvider, Access::readWrite)), DVNotPermittedError());
  EXPECT_EQ(calls_.all().size(), 1U);
}

TEST_F(ConsumerDocumentsTest, OpeningWithoutATokenOrABundleAsksNobody) {
  startServices();
  script_.itemToken.reset();
  EXPECT_EQ(errorIn(consumer().open(document(), kProvider, Access::read)), own(ConsumerErrorCode::noToken));
  script_.itemToken = QXData::fromText("item");
  auto anonymous = Consumer::connect({});
  ASSERT_EQ(anonymous.index(), 0U);
  EXPECT_EQ(errorIn(std::get<0>(anonymous)->open(document(), kProvider, Access::read)), own(ConsumerErrorCode::noToken));
  EXPECT_THAT(calls_.all(), IsEmpty());
}

TEST_F(ConsumerDocumentsTest, AFileThatSomebodyHoldsIsTriedAgain) {
  put("item", "contents");
  failRedemptions(3, sandboxError(SandboxErrorCode::busy));
  startServices();
  EXPECT_EQ(errorIn(consumer().open(document(), kProvider, Access::read)), std::nullopt);
  EXPECT_EQ(count("redeem item for reading"), 4U);
}

TEST_F(ConsumerDocumentsTest, AFileThatSomebodyHoldsAllTheTimeIsTheDeadlinesErrorAboveTheReason) {
  put("item", "contents");
  failRedemptions(1'000'000, sandboxError(SandboxErrorCode::busy));
  startServices();
  const auto redeemed = consumer().within(1s).redeem(QXData::fromText("item"), Access::read);
  EXPECT_EQ(errorIn(redeemed), own(ConsumerErrorCode::deadlinePassed));
  ASSERT_TRUE(std::get<QXError>(redeemed).underlying);
  EXPECT_EQ(*std::get<QXError>(redeemed).underlying, sandboxError(SandboxErrorCode::busy));
  EXPECT_EQ(errorIn(consumer_->within(50ms).open(document(), kProvider, Access::read)), own(ConsumerErrorCode::deadlinePassed));
}

TEST_F(ConsumerDocumentsTest, OtherErrorsOfATokenAreNotTriedAgain) {
  for (const SandboxErrorCode code : {SandboxErrorCode::gone, SandboxErrorCode::notRegularFile, SandboxErrorCode::notPermitted}) {
    auto script = script_.redeem;
    failRedemptions(1, sandboxError(code));
    startServices();
    EXPECT_EQ(std::get<QXError>(consumer().open(document(), kProvider, Access::read)), sandboxError(code));
    stopServices();
    script_.redeem = script;
  }
  EXPECT_EQ(count("redeem item for reading"), 3U);
}

TEST_F(ConsumerDocumentsTest, ADocumentWithItsStringIsOpenedWithNewTokensWhenTheOldOnesAreWorthless) {
  put("newer", "contents");
  failRedemptions(1, sandboxError(SandboxErrorCode::badToken));
  startServices();
  Document old = document();
  old.bookmarkableString = "docuvend:p/i";
  script_.url = QXURL::fromString("file:///storage/moved.txt");
  script_.itemToken = QXData::fromText("newer");
  const auto opened = consumer().open(old, kProvider, Access::read);
  ASSERT_EQ(opened.index(), 0U);
  EXPECT_EQ(contentsOf(std::get<QXDescriptor>(opened).number), "contents");
  EXPECT_THAT(calls_.all(),
              ElementsAre("start file:///storage/letter.txt com.example.provider com.example.consumer", "redeem item for reading",
                          "document of docuvend:p/i", "start file:///storage/moved.txt com.example.provider com.example.consumer",
                          "redeem newer for reading"));
}

TEST_F(ConsumerDocumentsTest, NewTokensAreAskedForOnce) {
  failRedemptions(1'000, sandboxError(SandboxErrorCode::badToken));
  startServices();
  Document old = document();
  old.bookmarkableString = "docuvend:p/i";
  EXPECT_EQ(std::get<QXError>(consumer().open(old, kProvider, Access::read)), sandboxError(SandboxErrorCode::badToken));
  EXPECT_EQ(count("document of docuvend:p/i"), 1U);
}

TEST_F(ConsumerDocumentsTest, ADocumentWithoutItsStringKeepsItsWorthlessTokens) {
  failRedemptions(1, sandboxError(SandboxErrorCode::badToken));
  startServices();
  EXPECT_EQ(std::get<QXError>(consumer().open(document(), kProvider, Access::read)), sandboxError(SandboxErrorCode::badToken));
  EXPECT_EQ(calls_.all().size(), 2U);
}

TEST_F(ConsumerDocumentsTest, WhoGetsNoNewTokensLearnsWhy) {
  failRedemptions(1, sandboxError(SandboxErrorCode::badToken));
  startServices();
  Document old = document();
  old.bookmarkableString = "docuvend:p/i";
  script_.starting = [this](const DVDaemon::ErrorReply& reply) {
    reply(std::nullopt);
    script_.error = DVNotPermittedError();  // for what comes next: the grant has been revoked
  };
  EXPECT_EQ(std::get<QXError>(consumer().open(old, kProvider, Access::read)), DVNotPermittedError());
}

// Progress.

TEST_F(ConsumerDocumentsTest, OpeningTellsWhatIsPresentOnTheCallingThreadUntilItReturns) {
  constexpr off_t kSize = off_t{1} << 20;
  constexpr std::size_t kPresent = 4096;
  put("item", std::string(kPresent, 'x'));
  ASSERT_EQ(::truncate(path("item").c_str(), kSize), 0);
  holdStarts();
  startServices();
  std::vector<Progress> told;
  const auto thread = std::this_thread::get_id();
  const auto opened = consumer().open(document(), kProvider, Access::read, [&](const Progress& progress) {
    EXPECT_EQ(std::this_thread::get_id(), thread);
    told.push_back(progress);
    if (told.size() < 2) return;
    // The provider is ready.
    if (const auto reply = started_.take()) (*reply)(std::nullopt);
  });
  EXPECT_EQ(errorIn(opened), std::nullopt);
  ASSERT_THAT(told, SizeIs(2));
  EXPECT_EQ(told[0].bytesPresent, kPresent);
  EXPECT_EQ(told[0].size, static_cast<std::uint64_t>(kSize));
  EXPECT_EQ(count("redeem item for reading"), 3U) << "each time anew, for the provider may replace the file; and once to open it";
}

TEST_F(ConsumerDocumentsTest, NoMoreIsPresentThanTheFileIsLong) {
  put("item", "short");
  holdStarts();
  startServices();
  std::optional<Progress> told;
  const auto opened = consumer().open(document(), kProvider, Access::read, [&](const Progress& progress) {
    told = progress;
    if (const auto reply = started_.take()) (*reply)(std::nullopt);
  });
  EXPECT_EQ(errorIn(opened), std::nullopt);
  ASSERT_TRUE(told);
  EXPECT_EQ(told->bytesPresent, 5U);
  EXPECT_EQ(told->size, 5U);
}

TEST_F(ConsumerDocumentsTest, WhatCannotBeSeenIsNotTold) {
  holdStarts();
  int looks = 0;
  script_.redeem = [&](const std::string&) -> std::variant<QXDescriptor, QXError> {
    if (++looks == 2) (*started_.take())(std::nullopt);
    return sandboxError(SandboxErrorCode::gone);
  };
  startServices();
  const auto opened = consumer().open(document(), kProvider, Access::read, [](const Progress&) { ADD_FAILURE() << "of what?"; });
  EXPECT_EQ(std::get<QXError>(opened), sandboxError(SandboxErrorCode::gone));
}

TEST_F(ConsumerDocumentsTest, ProvidingTellsWhatThisProcessSeesAtThePath) {
  put("letter.txt", "short");
  holdStarts();
  startServices();
  std::vector<Progress> told;
  const QXURL url = QXURL::fileURL(path("letter.txt"), QXURLKind::file);
  EXPECT_EQ(consumer().startProviding(url, kProvider, kConsumer,
                                      [&](const Progress& progress) {
                                        told.push_back(progress);
                                        if (const auto reply = started_.take()) (*reply)(std::nullopt);
                                      }),
            std::nullopt);
  ASSERT_THAT(told, SizeIs(1));
  EXPECT_EQ(told[0].bytesPresent, 5U);
  EXPECT_THAT(calls_.all(), SizeIs(1)) << "no token is needed";
}

// Replacing.

TEST_F(ConsumerDocumentsTest, ReplacingWritesTheEmptiedSiblingReplacesAndTells) {
  put("item", "old");
  put("sibling", "left by an earlier attempt");
  startServices();
  EXPECT_EQ(consumer().replace(document(), writeNew), std::nullopt);
  EXPECT_EQ(contentsOf("sibling"), "new");
  EXPECT_THAT(calls_.all(), ElementsAre("redeem item for reading", "redeem item for reading", "redeem sibling for writing",
                                        "redeem sibling for writing", "replace item by sibling", "finished file:///storage/letter.txt"));
  EXPECT_FALSE(isLocked("item"));
  EXPECT_FALSE(isLocked("sibling"));
}

TEST_F(ConsumerDocumentsTest, GivingUpReplacesNothingAndTellsNobody) {
  put("item", "old");
  put("sibling", "");
  startServices();
  const QXError givenUp = QXError::make("Test", 1, "given up");
  EXPECT_EQ(consumer().replace(document(), [&givenUp](const QXDescriptor&) -> Failure { return givenUp; }), givenUp);
  EXPECT_THAT(calls_.all(), ElementsAre("redeem item for reading", "redeem item for reading", "redeem sibling for writing",
                                        "redeem sibling for writing"));
  EXPECT_FALSE(isLocked("item"));
  EXPECT_FALSE(isLocked("sibling"));
}

TEST_F(ConsumerDocumentsTest, ASiblingThatCannotBeOpenedIsNotWritten) {
  startServices();
  bool isWritten = false;
  const auto write = [&isWritten](const QXDescriptor&) -> Failure {
    isWritten = true;
    return std::nullopt;
  };
  EXPECT_EQ(consumer().replace(document(), write), sandboxError(SandboxErrorCode::gone));
  EXPECT_EQ(count("redeem item for reading"), 1U) << "there is no item";
  put("item", "");
  EXPECT_EQ(consumer().replace(document(), write), sandboxError(SandboxErrorCode::gone));
  EXPECT_EQ(count("redeem sibling for writing"), 1U) << "there is no sibling";
  EXPECT_FALSE(isWritten);
}

TEST_F(ConsumerDocumentsTest, ASiblingThatCannotBeEmptiedIsNotWritten) {
  put("item", "old");
  put("sibling", "old");
  script_.redeem = [this](const std::string& token) {
    return linux_platform::toValue(UniqueDescriptor(::open(path(token).c_str(), O_RDONLY | O_CLOEXEC)));
  };
  startServices();
  const Failure failure = consumer().replace(document(), [](const QXDescriptor&) -> Failure {
    ADD_FAILURE() << "it still holds the old contents";
    return std::nullopt;
  });
  EXPECT_EQ(errorIn(failure), std::pair(std::string(kQXSystemErrorDomain), std::int64_t{EINVAL}));
  EXPECT_EQ(count("replace item by sibling"), 0U);
}

TEST_F(ConsumerDocumentsTest, AnItemThatCannotBeReplacedIsAnErrorAndNobodyIsTold) {
  put("item", "old");
  put("sibling", "");
  script_.replaceError = sandboxError(SandboxErrorCode::gone);
  startServices();
  EXPECT_EQ(consumer().replace(document(), writeNew), script_.replaceError);
  EXPECT_EQ(count("finished file:///storage/letter.txt"), 0U);
  EXPECT_FALSE(isLocked("sibling"));
}

TEST_F(ConsumerDocumentsTest, ADocumentWhoseProviderCannotBeToldIsSavedAllTheSame) {
  put("item", "old");
  put("sibling", "");
  script_.finishedError = QXError::make(linux_platform::kQXFileCoordinationErrorDomain, 3, "no provider");
  startServices();
  const Failure failure = consumer().replace(document(), writeNew);
  EXPECT_EQ(errorIn(failure), own(ConsumerErrorCode::notTold));
  ASSERT_TRUE(failure->underlying);
  EXPECT_EQ(*failure->underlying, *script_.finishedError);
}

TEST_F(ConsumerDocumentsTest, ReplacingNeedsBothTokens) {
  startServices();
  script_.siblingToken.reset();
  EXPECT_EQ(errorIn(consumer().replace(document(), writeNew)), own(ConsumerErrorCode::noToken));
  script_.siblingToken = QXData::fromText("sibling");
  script_.itemToken.reset();
  EXPECT_EQ(errorIn(consumer().replace(document(), writeNew)), own(ConsumerErrorCode::noToken));
  EXPECT_THAT(calls_.all(), IsEmpty());
}

TEST_F(ConsumerDocumentsTest, ADocumentWithItsStringIsReplacedWithNewTokensWhenTheOldOnesAreWorthless) {
  put("newer", "old");
  put("newer sibling", "");
  failRedemptions(1, sandboxError(SandboxErrorCode::badToken));
  startServices();
  Document old = document();
  old.bookmarkableString = "docuvend:p/i";
  script_.url = QXURL::fromString("file:///storage/moved.txt");
  script_.itemToken = QXData::fromText("newer");
  script_.siblingToken = QXData::fromText("newer sibling");
  EXPECT_EQ(consumer().replace(old, writeNew), std::nullopt);
  EXPECT_EQ(contentsOf("newer sibling"), "new");
  EXPECT_EQ(count("replace newer by newer sibling"), 1U);
  EXPECT_EQ(count("finished file:///storage/moved.txt"), 1U);
}

TEST_F(ConsumerDocumentsTest, TheLastStepIsNotRepeatedWhenTheDaemonEndsInIt) {
  put("item", "old");
  put("sibling", "");
  script_.replacing = [this](const auto&) { sandbox_->endConnections(); };
  startServices();
  EXPECT_EQ(errorIn(consumer().replace(document(), writeNew)), own(ConsumerErrorCode::connectionLost));
  EXPECT_EQ(count("replace item by sibling"), 1U);
}

// Savers.

class SaversTest : public ConsumerDocumentsTest {
 protected:
  SaversTest() {
    put("item", "old");
    put("sibling", "of an earlier saver");
  }
  [[nodiscard]] UniqueDescriptor lock(const std::string& name) const {
    UniqueDescriptor file(::open(path(name).c_str(), O_RDWR | O_CLOEXEC));
    EXPECT_EQ(::flock(file.get(), LOCK_EX | LOCK_NB), 0);
    return file;
  }
  // Before the token is redeemed for that many times.
  void before(const std::string& token, int time, std::function<void()> act) {
    script_.redeem = [token, time, act = std::move(act), redeem = script_.redeem](const std::string& given) mutable {
      if (given == token && --time == 0) act();
      return redeem(given);
    };
  }
  [[nodiscard]] Failure saveWithin(std::chrono::milliseconds deadline) { return consumer().within(deadline).replace(document(), writeNew); }

  Mailbox<linux_platform::QXSandboxRedemption::ErrorReply> replaced_;
};

TEST_F(SaversTest, ItemAndSiblingAreLockedWhileOneIsWrittenAndTheOtherReplaced) {
  script_.replacing = [this](const linux_platform::QXSandboxRedemption::ErrorReply& reply) {
    EXPECT_TRUE(isLocked("item"));
    EXPECT_TRUE(isLocked("sibling"));
    reply(std::nullopt);
  };
  startServices();
  EXPECT_EQ(consumer().replace(document(),
                               [this](const QXDescriptor& file) {
                                 EXPECT_TRUE(isLocked("item"));
                                 EXPECT_TRUE(isLocked("sibling"));
                                 return writeNew(file);
                               }),
            std::nullopt);
  EXPECT_FALSE(isLocked("item"));
  EXPECT_FALSE(isLocked("sibling"));
}

TEST_F(SaversTest, ASaverWaitsForTheOneBeforeIt) {
  for (const char* name : {"item", "sibling"}) {
    put("sibling", "of the other");
    UniqueDescriptor other = lock(name);
    const auto redeem = script_.redeem;
    before(name, 3, [&] {
      EXPECT_EQ(contentsOf("sibling"), "of the other");
      other.reset();
    });
    startServices();
    EXPECT_EQ(saveWithin(kNever), std::nullopt);
    EXPECT_EQ(contentsOf("sibling"), "new");
    EXPECT_FALSE(other) << "it was not waited for";
    consumer_.reset();
    stopServices();
    script_.redeem = redeem;
  }
}

TEST_F(SaversTest, ASaverWaitsNoLongerThanItsDeadline) {
  startServices();
  for (const char* name : {"item", "sibling"}) {
    const UniqueDescriptor other = lock(name);
    EXPECT_EQ(errorIn(saveWithin(100ms)), own(ConsumerErrorCode::deadlinePassed));
    EXPECT_EQ(contentsOf("sibling"), "of an earlier saver");
  }
}

TEST_F(SaversTest, TheTimeThatWritingTakesDoesNotCount) {
  static constexpr auto kDeadline = 2s;
  startServices();
  EXPECT_EQ(consumer().within(kDeadline).replace(document(),
                                                 [](const QXDescriptor& file) {
                                                   const auto end = std::chrono::steady_clock::now() + kDeadline;
                                                   while (std::chrono::steady_clock::now() < end) std::this_thread::yield();
                                                   return writeNew(file);
                                                 }),
            std::nullopt);
}

TEST_F(SaversTest, AnItemThatWasReplacedBeforeItWasLockedIsLockedAnew) {
  const auto replaced = std::make_shared<std::promise<UniqueDescriptor>>();
  auto other = replaced->get_future();
  // The saver before is at its end: the sibling is the item, which it still has locked.
  before("item", 2, [this, replaced] {
    EXPECT_EQ(::rename(path("sibling").c_str(), path("item").c_str()), 0);
    put("sibling", "");
    replaced->set_value(lock("item"));
  });
  startServices();
  // On a slow machine the next one finds the item replaced.
  do {
    EXPECT_EQ(errorIn(saveWithin(100ms)), own(ConsumerErrorCode::deadlinePassed)) << "the old item's lock is worth nothing";
  } while (other.wait_for(0s) != std::future_status::ready && !HasFailure());
  EXPECT_EQ(count("redeem sibling for writing"), 0U);
  ASSERT_FALSE(HasFailure());
  other.get().reset();
  EXPECT_EQ(saveWithin(kNever), std::nullopt);
}

TEST_F(SaversTest, ASiblingThatHasBecomeTheItemIsNotWritten) {
  before("sibling", 2, [this] {
    EXPECT_EQ(::rename(path("sibling").c_str(), path("item").c_str()), 0);
    put("sibling", "");
  });
  startServices();
  EXPECT_EQ(saveWithin(kNever), std::nullopt);
  EXPECT_EQ(contentsOf("item"), "of an earlier saver");
  EXPECT_EQ(contentsOf("sibling"), "new");
}

TEST_F(SaversTest, TheLocksAreHeldUntilItIsKnownWhetherTheSiblingHasTakenTheItemsPlace) {
  script_.replacing = [this](linux_platform::QXSandboxRedemption::ErrorReply reply) { replaced_.put(std::move(reply)); };
  startServices();
  EXPECT_EQ(errorIn(saveWithin(2s)), own(ConsumerErrorCode::deadlinePassed));
  EXPECT_TRUE(isLocked("item")) << "the daemon may rename at any moment";
  EXPECT_TRUE(isLocked("sibling"));
  const auto late = replaced_.take();
  ASSERT_TRUE(late);
  (*late)(std::nullopt);
  eventually("the next saver may write", [this] { return !isLocked("item") && !isLocked("sibling"); });
}

}  // namespace
}  // namespace docuvend::tests
