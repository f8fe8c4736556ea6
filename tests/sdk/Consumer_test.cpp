#include "sdk/Consumer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <filesystem>
#include <future>
#include <thread>

#include "common/DVErrors.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "service/DVDaemon.h"
#include "tests/sdk/ScriptedService.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using linux_platform::QXFileCoordination;
using linux_platform::QXSandboxRedemption;
using linux_platform::UniqueDescriptor;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
namespace fs = std::filesystem;

const ProviderID kProvider{"com.example.provider"};
const ConsumerID kConsumer{"com.example.consumer"};

// What was asked, in order, of all services together.
class Calls {
 public:
  void add(std::string call) {
    const std::lock_guard lock(mutex_);
    calls_.push_back(std::move(call));
  }
  [[nodiscard]] std::vector<std::string> all() {
    const std::lock_guard lock(mutex_);
    return calls_;
  }

 private:
  std::mutex mutex_;
  std::vector<std::string> calls_;
};

// What the services answer. Set before the first question.
struct Script {
  std::optional<QXError> error;
  std::optional<QXURL> url = QXURL::fromString("file:///storage/letter.txt");
  std::optional<QXURL> siblingURL = QXURL::fromString("file:///storage/.letter.txt");
  std::optional<QXData> itemToken = QXData::fromText("item");
  std::optional<QXData> siblingToken = QXData::fromText("sibling");
  std::optional<std::string> string = "docuvend:p/i";
  std::optional<QXDictionary> providers = QXDictionary{{"p", QXDictionary{}}};
  std::optional<QXError> redeemError;
  std::optional<QXError> replaceError;
  std::optional<QXError> finishedError;
  int file = -1;
  // Takes the reply of a waking instead of answering it.
  std::function<void(DVDaemon::Done)> waking;
};

class ScriptedDaemon : public DVDaemon {
 public:
  ScriptedDaemon(Script& script, Calls& calls) : script_(script), calls_(calls) {}

  void wakeUpCompletion(Done completion) override {
    calls_.add("wake");
    if (script_.waking) return script_.waking(std::move(completion));
    completion();
  }
  void extendSandboxForFileURL(std::optional<QXURL>, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> toConsumerID,
                               SandboxReply completionHandler) override {
    calls_.add("extend " + fromProviderID->value + " " + toConsumerID->value);
    if (script_.error) return completionHandler(script_.error, {}, {}, {});
    completionHandler({}, script_.itemToken, script_.siblingURL, script_.siblingToken);
  }
  void startProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> forConsumerID,
                               ErrorReply completionHandler) override {
    calls_.add("start " + url->absoluteString() + " " + fromProviderID->value + " " + forConsumerID->value);
    completionHandler(script_.error);
  }
  void providePlaceholderForItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                      std::optional<ConsumerID> forConsumerID, ErrorReply completionHandler) override {
    calls_.add("placeholder " + url->absoluteString() + " " + fromProviderID->value + " " + forConsumerID->value);
    completionHandler(script_.error);
  }
  void stopProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> forConsumerID,
                              ErrorReply completionHandler) override {
    calls_.add("stop " + url->absoluteString() + " " + fromProviderID->value + " " + forConsumerID->value);
    completionHandler(script_.error);
  }
  void extendBookmarkForFileURL(std::optional<QXURL> url, std::optional<ConsumerID> toConsumerID, StringReply completionHandler) override {
    calls_.add("bookmark " + url->absoluteString() + " " + toConsumerID->value);
    if (script_.error) return completionHandler({}, script_.error);
    completionHandler(script_.string, {});
  }
  void providersCompletionHandler(ProvidersReply completionHandler) override {
    if (script_.error) return completionHandler(script_.error, {});
    completionHandler({}, script_.providers);
  }
  void bookmarkableStringFromDocumentURL(std::optional<QXURL>, StringReply completion) override {
    if (script_.error) return completion({}, script_.error);
    completion(script_.string, {});
  }
  void documentURLFromBookmarkableString(std::optional<std::string>, DocumentReply completion) override {
    if (script_.error) return completion({}, {}, {}, {}, script_.error);
    completion(script_.url, script_.itemToken, script_.siblingURL, script_.siblingToken, {});
  }

 private:
  Script& script_;
  Calls& calls_;
};

class ScriptedSandbox : public QXSandboxRedemption {
 public:
  ScriptedSandbox(Script& script, Calls& calls) : script_(script), calls_(calls) {}

  void redeemToken(std::optional<QXData> token, std::optional<bool> forWriting, FileReply completionHandler) override {
    calls_.add("redeem " + token->text() + (*forWriting ? " for writing" : " for reading"));
    if (script_.redeemError) return completionHandler(script_.redeemError, {});
    if (script_.file < 0) return completionHandler({}, {});
    completionHandler({}, linux_platform::toValue(UniqueDescriptor(::dup(script_.file))));
  }
  void replaceItemWithToken(std::optional<QXData> itemToken, std::optional<QXData> bySiblingWithToken,
                            ErrorReply completionHandler) override {
    calls_.add("replace " + itemToken->text() + " by " + bySiblingWithToken->text());
    completionHandler(script_.replaceError);
  }

 private:
  Script& script_;
  Calls& calls_;
};

class ScriptedCoordination : public QXFileCoordination {
 public:
  ScriptedCoordination(Script& script, Calls& calls) : script_(script), calls_(calls) {}

  void writerDidFinishWritingForURL(std::optional<QXURL> url, ErrorReply completionHandler) override {
    calls_.add("finished " + url->absoluteString());
    completionHandler(script_.finishedError);
  }

 private:
  Script& script_;
  Calls& calls_;
};

class ConsumerTest : public ::testing::Test {
 protected:
  ConsumerTest() {
    std::string pattern = (fs::temp_directory_path() / "dvXXXXXX").string();
    if (::mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no directory for a test");
    root_ = pattern;
    fs::create_directories(root_ + "/docuvend/public");
    ::setenv("XDG_RUNTIME_DIR", root_.c_str(), 1);
  }
  ~ConsumerTest() override {
    consumer_.reset();
    stopServices();
    fs::remove_all(root_);
  }

  std::string socket(const std::string& name) const { return root_ + "/docuvend/public/" + name; }
  void startServices() {
    daemon_ = std::make_unique<ScriptedService<DVDaemon>>(socket(kDVServiceName), std::make_shared<ScriptedDaemon>(script_, calls_));
    sandbox_ = std::make_unique<ScriptedService<QXSandboxRedemption>>(socket(linux_platform::kSandboxServiceName),
                                                                      std::make_shared<ScriptedSandbox>(script_, calls_));
    coordination_ = std::make_unique<ScriptedService<QXFileCoordination>>(socket(linux_platform::kFileCoordinationServiceName),
                                                                          std::make_shared<ScriptedCoordination>(script_, calls_));
  }
  void stopServices() {
    daemon_.reset();
    sandbox_.reset();
    coordination_.reset();
  }
  Consumer& consumer(Consumer::Options options = {}) {
    if (!options.actAs) options.actAs = kConsumer.value;
    auto connected = Consumer::connect(std::move(options));
    if (auto* made = std::get_if<std::unique_ptr<Consumer>>(&connected)) consumer_ = std::move(*made);
    if (!consumer_) throw std::runtime_error(std::get<QXError>(connected).description());
    return *consumer_;
  }
  // Wakings are put into `taken_` instead of being answered.
  void holdWakings() {
    script_.waking = [this](DVDaemon::Done completion) { taken_.put(std::move(completion)); };
  }
  Document document() const { return {*script_.url, script_.itemToken, script_.siblingURL, script_.siblingToken}; }
  // The file that tokens are redeemed for.
  UniqueDescriptor makeFile(const std::string& contents) {
    UniqueDescriptor file(::memfd_create("file", MFD_CLOEXEC));
    EXPECT_EQ(::pwrite(file.get(), contents.data(), contents.size(), 0), static_cast<ssize_t>(contents.size()));
    script_.file = file.get();
    return file;
  }
  static std::string contentsOfFile(const UniqueDescriptor& file) {
    std::string text(100, '\0');
    const ssize_t count = ::pread(file.get(), text.data(), text.size(), 0);
    text.resize(count < 0 ? 0 : static_cast<std::size_t>(count));
    return text;
  }

  template <class T>
  static std::optional<std::pair<std::string, std::int64_t>> errorIn(const Result<T>& result) {
    const auto* error = std::get_if<QXError>(&result);
    if (error == nullptr) return std::nullopt;
    return std::pair(error->domain, error->code);
  }
  static std::optional<std::pair<std::string, std::int64_t>> errorIn(const Failure& failure) {
    if (!failure) return std::nullopt;
    return std::pair(failure->domain, failure->code);
  }
  static std::optional<std::pair<std::string, std::int64_t>> own(ConsumerErrorCode code) {
    return std::pair(std::string(kConsumerErrorDomain), static_cast<std::int64_t>(code));
  }

  std::string root_;
  Script script_;
  Calls calls_;
  Mailbox<DVDaemon::Done> taken_;
  std::unique_ptr<ScriptedService<DVDaemon>> daemon_;
  std::unique_ptr<ScriptedService<QXSandboxRedemption>> sandbox_;
  std::unique_ptr<ScriptedService<QXFileCoordination>> coordination_;
  std::unique_ptr<Consumer> consumer_;
};

// Reaching the daemon.

TEST_F(ConsumerTest, WithoutARunTimeDirectoryTheDaemonIsUnreachable) {
  startServices();
  ::unsetenv("XDG_RUNTIME_DIR");
  EXPECT_EQ(errorIn(Consumer::connect({})), own(ConsumerErrorCode::unreachable));
  ::setenv("XDG_RUNTIME_DIR", "relative", 1);
  EXPECT_EQ(errorIn(Consumer::connect({})), own(ConsumerErrorCode::unreachable));
}

TEST_F(ConsumerTest, WithoutADaemonItIsUnreachableAndSaysWhy) {
  const auto connected = Consumer::connect({});
  EXPECT_EQ(errorIn(connected), own(ConsumerErrorCode::unreachable));
  ASSERT_TRUE(std::get<QXError>(connected).underlying);
  EXPECT_EQ(std::get<QXError>(connected).underlying->code, ENOENT);
}

TEST_F(ConsumerTest, TheBundleThatItActsForIsDeclaredToEveryService) {
  startServices();
  makeFile("");
  Consumer& daemon = consumer();
  EXPECT_EQ(daemon.ownIdentifier(), kConsumer);
  EXPECT_EQ(daemon.wakeUp(), std::nullopt);
  EXPECT_EQ(errorIn(daemon.redeem(QXData::fromText("item"), Access::read)), std::nullopt);
  EXPECT_EQ(daemon.finishedWriting(*script_.url), std::nullopt);
  EXPECT_THAT(daemon_->declared(), ElementsAre(kConsumer.value));
  EXPECT_THAT(sandbox_->declared(), ElementsAre(kConsumer.value));
  EXPECT_THAT(coordination_->declared(), ElementsAre(kConsumer.value));
}

TEST_F(ConsumerTest, OneConnectionServesManyCallsAndThreads) {
  startServices();
  Consumer& daemon = consumer();
  std::atomic<int> answered = 0;
  std::vector<std::thread> threads;
  for (int i = 0; i < 8; ++i) {
    threads.emplace_back([&daemon, &answered] {
      for (int call = 0; call < 50; ++call) {
        if (!daemon.wakeUp()) ++answered;
      }
    });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(answered, 400);
  EXPECT_EQ(daemon_->declared().size(), 1U);
}

TEST_F(ConsumerTest, AnAnswerThatDoesNotComeIsTheDeadlinesErrorAndLateItIsDropped) {
  holdWakings();
  startServices();
  Consumer& daemon = consumer({std::nullopt, std::chrono::milliseconds(1), std::chrono::milliseconds(1)});
  EXPECT_EQ(errorIn(daemon.wakeUp()), own(ConsumerErrorCode::deadlinePassed));
  const auto late = taken_.take();
  ASSERT_TRUE(late);
  (*late)();
  EXPECT_EQ(errorIn(daemon.wakeUp()), own(ConsumerErrorCode::deadlinePassed));
}

TEST_F(ConsumerTest, ADaemonThatEndsDuringACallIsAnErrorAndNotAWait) {
  holdWakings();
  startServices();
  Consumer& daemon = consumer();
  auto answer = std::async(std::launch::async, [&daemon] { return daemon.wakeUp(); });
  const auto held = taken_.take();
  ASSERT_TRUE(held);
  stopServices();
  ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
  const Failure failure = answer.get();
  ASSERT_TRUE(failure);
  EXPECT_NE(failure->domain, kConsumerErrorDomain);
}

TEST_F(ConsumerTest, ADaemonThatIsGoneIsUnreachableAndServesAgainWhenItIsBack) {
  startServices();
  Consumer& daemon = consumer();
  ASSERT_EQ(daemon.wakeUp(), std::nullopt);
  stopServices();
  eventually("it is unreachable", [&daemon] { return errorIn(daemon.wakeUp()) == own(ConsumerErrorCode::unreachable); });
  startServices();
  EXPECT_EQ(daemon.wakeUp(), std::nullopt);
  EXPECT_EQ(daemon_->declared().size(), 1U);
}

// Answers.

TEST_F(ConsumerTest, ValuesComeThroughAsTheyWereAnswered) {
  startServices();
  Consumer& daemon = consumer();
  const auto extended = daemon.extendSandbox(*script_.url, kProvider, kConsumer);
  ASSERT_EQ(extended.index(), 0U);
  EXPECT_EQ(std::get<Document>(extended).url, *script_.url);
  EXPECT_EQ(std::get<Document>(extended).itemToken, script_.itemToken);
  EXPECT_EQ(std::get<Document>(extended).siblingURL, script_.siblingURL);
  EXPECT_EQ(std::get<Document>(extended).siblingToken, script_.siblingToken);
  const auto resolved = daemon.documentURL("docuvend:p/i");
  ASSERT_EQ(resolved.index(), 0U);
  EXPECT_EQ(std::get<Document>(resolved).url, *script_.url);
  EXPECT_EQ(std::get<Document>(resolved).siblingToken, script_.siblingToken);
  EXPECT_EQ(daemon.bookmarkableString(*script_.url), Result<std::string>("docuvend:p/i"));
  EXPECT_EQ(daemon.providers(), Result<QXDictionary>(*script_.providers));
  EXPECT_EQ(daemon.startProviding(*script_.url, kProvider, kConsumer), std::nullopt);
  EXPECT_THAT(calls_.all(), ElementsAre("extend com.example.provider com.example.consumer",
                                        "start file:///storage/letter.txt com.example.provider com.example.consumer"));
}

TEST_F(ConsumerTest, ErrorsComeThroughAsTheyWereAnswered) {
  script_.error = DVNotFoundError(DVInvalidParameterError("providerID", "p"));
  startServices();
  Consumer& daemon = consumer();
  EXPECT_EQ(std::get<QXError>(daemon.extendSandbox(*script_.url, kProvider, kConsumer)), *script_.error);
  EXPECT_EQ(std::get<QXError>(daemon.documentURL("docuvend:p/i")), *script_.error);
  EXPECT_EQ(std::get<QXError>(daemon.bookmarkableString(*script_.url)), *script_.error);
  EXPECT_EQ(std::get<QXError>(daemon.providers()), *script_.error);
  EXPECT_EQ(daemon.startProviding(*script_.url, kProvider, kConsumer), script_.error);
}

TEST_F(ConsumerTest, AnAnswerWithNeitherValueNorErrorIsAnError) {
  script_.url.reset();
  script_.string.reset();
  script_.providers.reset();
  startServices();
  Consumer& daemon = consumer();
  const QXURL url = *QXURL::fromString("file:///x");
  EXPECT_EQ(errorIn(daemon.documentURL("docuvend:p/i")), own(ConsumerErrorCode::noAnswer));
  EXPECT_EQ(errorIn(daemon.bookmarkableString(url)), own(ConsumerErrorCode::noAnswer));
  EXPECT_EQ(errorIn(daemon.providers()), own(ConsumerErrorCode::noAnswer));
  EXPECT_EQ(errorIn(daemon.redeem(QXData::fromText("item"), Access::read)), own(ConsumerErrorCode::noAnswer));
}

// Opening.

TEST_F(ConsumerTest, OpeningHasTheDocumentProvidedAndThenRedeemsItsToken) {
  const auto file = makeFile("contents");
  startServices();
  const auto opened = consumer().open(document(), kProvider, Access::read);
  ASSERT_EQ(opened.index(), 0U);
  std::string text(8, '\0');
  EXPECT_EQ(::pread(std::get<QXDescriptor>(opened).number, text.data(), text.size(), 0), 8);
  EXPECT_EQ(text, "contents");
  EXPECT_THAT(calls_.all(),
              ElementsAre("start file:///storage/letter.txt com.example.provider com.example.consumer", "redeem item for reading"));
}

TEST_F(ConsumerTest, WhatIsNotProvidedIsNotOpened) {
  script_.error = DVNotPermittedError();
  const auto file = makeFile("zeros");
  startServices();
  EXPECT_EQ(std::get<QXError>(consumer().open(document(), kProvider, Access::readWrite)), DVNotPermittedError());
  EXPECT_EQ(calls_.all().size(), 1U);
}

TEST_F(ConsumerTest, OpeningWithoutATokenOrABundleAsksNobody) {
  startServices();
  script_.itemToken.reset();
  EXPECT_EQ(errorIn(consumer().open(document(), kProvider, Access::read)), own(ConsumerErrorCode::noToken));
  script_.itemToken = QXData::fromText("item");
  auto anonymous = Consumer::connect({});
  ASSERT_EQ(anonymous.index(), 0U);
  EXPECT_EQ(errorIn(std::get<0>(anonymous)->open(document(), kProvider, Access::read)), own(ConsumerErrorCode::noToken));
  EXPECT_THAT(calls_.all(), IsEmpty());
}

// Replacing.

Failure writeNew(const QXDescriptor& file) {
  return ::pwrite(file.number, "new", 3, 0) == 3 ? Failure() : Failure(QXError::system(errno, "cannot write"));
}

TEST_F(ConsumerTest, ReplacingWritesTheEmptiedSiblingReplacesAndTells) {
  const auto sibling = makeFile("left by an earlier attempt");
  startServices();
  EXPECT_EQ(consumer().replace(document(), writeNew), std::nullopt);
  EXPECT_EQ(contentsOfFile(sibling), "new");
  EXPECT_THAT(calls_.all(), ElementsAre("redeem sibling for writing", "replace item by sibling", "finished file:///storage/letter.txt"));
}

TEST_F(ConsumerTest, GivingUpReplacesNothingAndTellsNobody) {
  const auto sibling = makeFile("");
  startServices();
  const QXError givenUp = QXError::make("Test", 1, "given up");
  EXPECT_EQ(consumer().replace(document(), [&givenUp](const QXDescriptor&) -> Failure { return givenUp; }), givenUp);
  EXPECT_THAT(calls_.all(), ElementsAre("redeem sibling for writing"));
}

TEST_F(ConsumerTest, ASiblingThatCannotBeOpenedIsNotWritten) {
  script_.redeemError = QXError::make(linux_platform::kQXSandboxErrorDomain, 4, "busy");
  startServices();
  bool isWritten = false;
  EXPECT_EQ(consumer().replace(document(),
                               [&isWritten](const QXDescriptor&) -> Failure {
                                 isWritten = true;
                                 return std::nullopt;
                               }),
            script_.redeemError);
  EXPECT_FALSE(isWritten);
  EXPECT_EQ(calls_.all().size(), 1U);
}

TEST_F(ConsumerTest, AnItemThatCannotBeReplacedIsAnErrorAndNobodyIsTold) {
  const auto sibling = makeFile("");
  script_.replaceError = QXError::make(linux_platform::kQXSandboxErrorDomain, 3, "gone");
  startServices();
  EXPECT_EQ(consumer().replace(document(), writeNew), script_.replaceError);
  EXPECT_EQ(calls_.all().size(), 2U);
}

TEST_F(ConsumerTest, ReplacingNeedsBothTokens) {
  startServices();
  script_.siblingToken.reset();
  EXPECT_EQ(errorIn(consumer().replace(document(), writeNew)), own(ConsumerErrorCode::noToken));
  script_.siblingToken = QXData::fromText("sibling");
  script_.itemToken.reset();
  EXPECT_EQ(errorIn(consumer().replace(document(), writeNew)), own(ConsumerErrorCode::noToken));
  EXPECT_THAT(calls_.all(), IsEmpty());
}

// Over the real daemon.

class ConsumerOfTheDaemon : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    house_.install(kCellar);
    house_.install(kPicker);
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
    house_.startDaemon();
    ::setenv("XDG_RUNTIME_DIR", house_.runtime().c_str(), 1);
    auto connected = Consumer::connect({kPicker});
    ASSERT_EQ(connected.index(), 0U);
    consumer_ = std::move(std::get<0>(connected));
    auto granted = consumer_->extendSandbox(QXURL::fileURL(letter_, QXURLKind::file), ProviderID{kCellar}, ConsumerID{kPicker});
    ASSERT_EQ(granted.index(), 0U);
    document_ = std::get<Document>(granted);
  }

  std::string letter_;
  std::unique_ptr<Consumer> consumer_;
  std::optional<Document> document_;
};

TEST_F(ConsumerOfTheDaemon, GivingUpLeavesTheItemUntouchedAndALaterSaveIsWhole) {
  ASSERT_EQ(consumer_->open(*document_, ProviderID{kCellar}, Access::read).index(), 0U);
  const QXError givenUp = QXError::make("Test", 1, "given up");
  EXPECT_EQ(consumer_->replace(*document_,
                               [&givenUp](const QXDescriptor& file) -> Failure {
                                 EXPECT_EQ(::pwrite(file.number, "half of something long", 22, 0), 22);
                                 return givenUp;
                               }),
            givenUp);
  EXPECT_EQ(contentsOf(letter_), "Dear all\n");
  EXPECT_EQ(contentsOf(house_.cloudFile("letter.txt")), "Dear all\n");
  EXPECT_EQ(consumer_->replace(*document_, writeNew), std::nullopt);
  EXPECT_EQ(contentsOf(letter_), "new");
  eventually("the cloud has it", [this] { return contentsOf(house_.cloudFile("letter.txt")) == "new"; });
}

TEST_F(ConsumerOfTheDaemon, ItWorksOnAfterTheDaemonWasKilledAndStartedAgain) {
  house_.killDaemon();
  EXPECT_NE(consumer_->wakeUp(), std::nullopt);
  house_.startDaemon();
  eventually("it is reached again", [this] { return !consumer_->wakeUp(); });
  const auto opened = consumer_->open(*document_, ProviderID{kCellar}, Access::read);
  EXPECT_EQ(opened.index(), 0U);
}

TEST_F(ConsumerOfTheDaemon, AWriteInPlaceIsToldToTheProvider) {
  const auto opened = consumer_->open(*document_, ProviderID{kCellar}, Access::readWrite);
  ASSERT_EQ(opened.index(), 0U);
  ASSERT_EQ(::pwrite(std::get<QXDescriptor>(opened).number, "DEAR", 4, 0), 4);
  EXPECT_EQ(consumer_->finishedWriting(document_->url), std::nullopt);
  eventually("the cloud has it", [this] { return contentsOf(house_.cloudFile("letter.txt")) == "DEAR all\n"; });
}

}  // namespace
}  // namespace docuvend::tests
