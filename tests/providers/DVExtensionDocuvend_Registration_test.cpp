#include <chrono>
#include <limits>

#include "common/DVErrors.h"
#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

using fake_platform::FakeFileCoordinator;
using fake_platform::kFakeGlobalQueueLabel;
using namespace std::chrono_literals;

const char* const kMethod = "debug: [DEBUG] -[DVExtensionDocuvend registerWithFileCoordinatorRetryCount:completion:]";
const char* const kBeginning = "debug: [DEBUG] Beginning extension request.";
const char* const kRequestFailed = "fault: [ERROR] Extension request failed. Error: TestDomain 7: broken";
const char* const kErrorRegistering = "fault: [ERROR] Error registering docuvend extension com.orvane.cellar: TestDomain 7: broken.";
const char* const kFailedToInitialize =
    "fault: [ERROR] Docuvend extension com.orvane.cellar failed to initialize. Error: TestDomain 7: broken.";
const char* const kTwoTriesLeft = "default: [NOTICE] Trying to register docuvend extension com.orvane.cellar again. Tries left: 2";
const char* const kOneTryLeft = "default: [NOTICE] Trying to register docuvend extension com.orvane.cellar again. Tries left: 1";
const char* const kRegistered =
    "info: [INFO] Registered docuvend extension com.orvane.cellar for path "
    "file:///containers/group.com.orvane.cellar/Docuvend%20Storage/";
const std::string kOperationQueue = "Operation queue for com.orvane.cellar";

class RegistrationTest : public ProvidersTest {
 protected:
  RegistrationTest() {
    extension = install(kCellar);
    provider = DVExtensionDocuvend::initWithExtension(extension);
  }

  // Records the outcome, marks it in the log, and where it ran.
  DVExtensionDocuvend::ErrorCompletion recorder() {
    return [this](std::optional<QXError> error) {
      trace("completion");
      completions.push_back(std::move(error));
      completionLabels.push_back(platform.queues.currentLabel());
    };
  }

  void answerSetup(std::optional<QXError> error) {
    QXArray reply{QXValue("unused"), QXValue(file("/unused")), QXValue()};
    if (error) reply[2] = *error;
    extension->vendor().answerLast(std::move(reply));
  }
  void respondToSetupWith(const QXError& error) {
    extension->vendor().respond("_performInitialSetupWithCompletion:", [error](const QXArray&) {
      return QXArray{QXValue(), QXValue(), QXValue(error)};
    });
  }

  std::shared_ptr<TracingExtension> extension;
  std::shared_ptr<DVExtensionDocuvend> provider;
  std::vector<std::optional<QXError>> completions;
  Texts completionLabels;
};

TEST_F(RegistrationTest, ASuccessfulSetupIsFollowedByTheRegistrationOnTheOperationQueue) {
  provider->registerWithFileCoordinatorRetryCount(3, recorder());
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning}));
  EXPECT_EQ(extension->vendor().operationNames(), Texts{"_performInitialSetupWithCompletion:"});
  answerSetup(std::nullopt);
  EXPECT_EQ(written(), Lines{"~ cancel 1"}) << "the request ends when the operation has been queued, before it runs";
  EXPECT_EQ(platform.queues.pending(kOperationQueue), 1U);
  EXPECT_TRUE(platform.fileCoordinator.calls().empty());
  platform.queues.runAll();
  EXPECT_EQ(platform.fileCoordinator.calls(), (std::vector<FakeFileCoordinator::Call>{{FakeFileCoordinator::Action::add, provider}}));
  EXPECT_EQ(written(), (Lines{kRegistered, "~ completion"}));
  EXPECT_EQ(completions, std::vector<std::optional<QXError>>{std::nullopt});
  EXPECT_EQ(completionLabels, Texts{kOperationQueue});
}

TEST_F(RegistrationTest, TheRequestEndsWhenTheRegistrationHasBeenQueued) {
  int cancels = 0;
  extension->onCancel = [this, &cancels] {
    ++cancels;
    EXPECT_EQ(platform.queues.pending(kOperationQueue), 1U);
  };
  provider->registerWithFileCoordinatorRetryCount(3, recorder());
  answerSetup(std::nullopt);
  EXPECT_EQ(cancels, 1);
}

TEST_F(RegistrationTest, TheRetryIsAnnouncedBeforeThePauseBegins) {
  extension->failBegins(broken);
  whenWritten("[NOTICE] Trying to register", [this] { EXPECT_EQ(platform.queues.pendingTimers(), 0U); });
  provider->registerWithFileCoordinatorRetryCount(2, recorder());
  EXPECT_EQ(looks, 1);
  EXPECT_EQ(platform.queues.pendingTimers(), 1U);
}

TEST_F(RegistrationTest, TheRegistrationPrecedesItsMessageAndTheCompletion) {
  whenWritten("[INFO] Registered docuvend extension", [this] { EXPECT_EQ(platform.fileCoordinator.providers().size(), 1U); });
  provider->registerWithFileCoordinatorRetryCount(3, [this](std::optional<QXError>) {
    EXPECT_EQ(platform.fileCoordinator.providers().size(), 1U);
    EXPECT_EQ(written().back(), kRegistered);
    trace("completion");
  });
  answerSetup(std::nullopt);
  platform.queues.runAll();
  EXPECT_EQ(written(), Lines{"~ completion"});
  EXPECT_EQ(looks, 1);
}

TEST_F(RegistrationTest, AProviderWithoutDirectoryIsRegisteredAllTheSame) {
  provider->setProvidedItemsURL(std::nullopt);
  provider->registerWithFileCoordinatorRetryCount(3, recorder());
  answerSetup(std::nullopt);
  platform.queues.runAll();
  EXPECT_EQ(platform.fileCoordinator.providers().size(), 1U);
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning, "~ cancel 1",
                              "info: [INFO] Registered docuvend extension com.orvane.cellar for path (null)", "~ completion"}));
}

TEST_F(RegistrationTest, ARegistrationThatNobodyWaitsForIsMadeAndLoggedAllTheSame) {
  provider->registerWithFileCoordinatorRetryCount(1, /*completion=*/{});
  answerSetup(std::nullopt);
  platform.queues.runAll();
  EXPECT_EQ(platform.fileCoordinator.providers().size(), 1U);
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning, "~ cancel 1", kRegistered}));
  provider->registerWithFileCoordinatorRetryCount(1, /*completion=*/{});
  answerSetup(broken);
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning, kFailedToInitialize, "~ cancel 2"}));
  extension->failBegins(broken);
  provider->registerWithFileCoordinatorRetryCount(0, /*completion=*/{});
  EXPECT_EQ(platform.queues.runAll(), 0U);
  EXPECT_TRUE(written().empty());
}

TEST_F(RegistrationTest, ARegistrationThatNobodyWaitsForIsTriedAgainAllTheSame) {
  extension->failBegins(broken);
  provider->registerWithFileCoordinatorRetryCount(3, /*completion=*/{});
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning, kRequestFailed, kErrorRegistering, kTwoTriesLeft}));
  for (int later = 0; later < 3; ++later) {
    platform.queues.advance(2s);
    platform.queues.runAll();
  }
  EXPECT_EQ(extension->beginCount(), 3);
}

// An identifier that is set while a registration is under way is the one that the lines name.
TEST_F(RegistrationTest, TheLinesNameTheProviderAndItsDirectoryAsTheyAreWhenTheyAreWritten) {
  provider->registerWithFileCoordinatorRetryCount(1, recorder());
  provider->setIdentifier(ProviderID{kAttic});
  answerSetup(broken);
  EXPECT_EQ(written().at(3), Line("fault: [ERROR] Docuvend extension com.orvane.attic failed to initialize. Error: TestDomain 7: broken."));
  extension->failBegins(broken);
  provider->registerWithFileCoordinatorRetryCount(2, recorder());
  const Lines lines = written();
  ASSERT_EQ(lines.size(), 6U);
  EXPECT_EQ(lines[4], Line("fault: [ERROR] Error registering docuvend extension com.orvane.attic: TestDomain 7: broken."));
  EXPECT_EQ(lines[5], Line("default: [NOTICE] Trying to register docuvend extension com.orvane.attic again. Tries left: 1"));

  extension->answerBegins();
  provider->registerWithFileCoordinatorRetryCount(1, recorder());
  answerSetup(std::nullopt);
  provider->setIdentifier(ProviderID{kShed});
  provider->setProvidedItemsURL(directory("/elsewhere"));
  written();
  platform.queues.runAll();
  EXPECT_EQ(written().front(), Line("info: [INFO] Registered docuvend extension com.orvane.shed for path file:///elsewhere/"));
}

TEST_F(RegistrationTest, ThreeTriesTwoSecondsApartAndTheThirdErrorReachesTheCompletion) {
  const QXError first = QXError::make("TestDomain", 1, "first");
  const QXError second = QXError::make("TestDomain", 2, "second");
  const QXError third = QXError::make("TestDomain", 3, "third");
  extension->failBegins(first);
  provider->registerWithFileCoordinatorRetryCount(3, recorder());
  EXPECT_EQ(written(),
            (Lines{kMethod, "~ begin", kBeginning, "fault: [ERROR] Extension request failed. Error: TestDomain 1: first",
                   "fault: [ERROR] Error registering docuvend extension com.orvane.cellar: TestDomain 1: first.", kTwoTriesLeft}));
  EXPECT_EQ(platform.queues.pendingTimers(), 1U);

  extension->failBegins(second);
  platform.queues.advance(2s - 1ns);
  platform.queues.runAll();
  EXPECT_EQ(extension->beginCount(), 1) << "not yet";
  platform.queues.advance(1ns);
  EXPECT_EQ(platform.queues.pendingOnGlobalQueue(), 1U);
  platform.queues.runAll();
  EXPECT_EQ(written(),
            (Lines{kMethod, "~ begin", kBeginning, "fault: [ERROR] Extension request failed. Error: TestDomain 2: second",
                   "fault: [ERROR] Error registering docuvend extension com.orvane.cellar: TestDomain 2: second.", kOneTryLeft}));

  extension->failBegins(third);
  platform.queues.advance(2s - 1ns);
  platform.queues.runAll();
  EXPECT_TRUE(completions.empty()) << "not yet";
  platform.queues.advance(1ns);
  platform.queues.runAll();
  EXPECT_EQ(written(),
            (Lines{kMethod, "~ begin", kBeginning, "fault: [ERROR] Extension request failed. Error: TestDomain 3: third",
                   "fault: [ERROR] Error registering docuvend extension com.orvane.cellar: TestDomain 3: third.", "~ completion"}));
  EXPECT_EQ(completions, std::vector<std::optional<QXError>>{third}) << "as it came, not wrapped";
  EXPECT_EQ(platform.queues.pendingTimers(), 0U);
  EXPECT_EQ(extension->beginCount(), 3);
  EXPECT_TRUE(extension->cancelled().empty()) << "a request that failed before there was a proxy is left alone";
  EXPECT_TRUE(platform.fileCoordinator.calls().empty());
}

TEST_F(RegistrationTest, ARetryMaySucceed) {
  extension->failBegins(broken);
  provider->registerWithFileCoordinatorRetryCount(2, recorder());
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning, kRequestFailed, kErrorRegistering, kOneTryLeft}));
  extension->answerBegins();
  FakePlatform::succeedSetup(*extension);
  platform.queues.advance(2s);
  platform.queues.runAll();
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning, "~ cancel 2", kRegistered, "~ completion"}));
  EXPECT_EQ(completions, std::vector<std::optional<QXError>>{std::nullopt});
}

TEST_F(RegistrationTest, ASetupThatFailsIsTriedAgainBeforeItsRequestEnds) {
  provider->registerWithFileCoordinatorRetryCount(3, recorder());
  written();
  int cancels = 0;
  extension->onCancel = [this, &cancels] {
    ++cancels;
    EXPECT_EQ(platform.queues.pendingTimers(), 1U);
  };
  answerSetup(broken);
  EXPECT_EQ(written(), (Lines{kFailedToInitialize, kTwoTriesLeft, "~ cancel 1"}));
  EXPECT_EQ(cancels, 1);
  EXPECT_EQ(platform.queues.pendingTimers(), 1U);
  EXPECT_TRUE(completions.empty());
  platform.queues.advance(2s);
  platform.queues.runAll();
  EXPECT_EQ(extension->beginCount(), 2);
}

TEST_F(RegistrationTest, TheLastSetupErrorReachesTheCompletionBeforeTheRequestEnds) {
  provider->registerWithFileCoordinatorRetryCount(1, recorder());
  written();
  answerSetup(broken);
  EXPECT_EQ(written(), (Lines{kFailedToInitialize, "~ completion", "~ cancel 1"}));
  EXPECT_EQ(completions, std::vector<std::optional<QXError>>{broken});
  EXPECT_EQ(completionLabels, Texts{""}) << "where the extension's answer arrived";
  EXPECT_EQ(platform.queues.pendingTimers(), 0U);
}

TEST_F(RegistrationTest, ThreeFailingSetupsReportTheThird) {
  respondToSetupWith(broken);
  provider->registerWithFileCoordinatorRetryCount(3, recorder());
  platform.queues.advance(2s);
  platform.queues.runAll();
  EXPECT_TRUE(completions.empty());
  respondToSetupWith(lost);
  platform.queues.advance(2s);
  platform.queues.runAll();
  EXPECT_EQ(completions, std::vector<std::optional<QXError>>{lost});
  EXPECT_EQ(extension->cancelled().size(), 3U);
}

TEST_F(RegistrationTest, AMissingProxyIsAFailureLikeAnyOther) {
  extension->setHasContexts(false);
  provider->registerWithFileCoordinatorRetryCount(1, recorder());
  const QXError proxyNotFound = DVProxyNotFoundError(ProviderID{kCellar});
  EXPECT_EQ(completions, std::vector<std::optional<QXError>>{proxyNotFound});
  EXPECT_TRUE(extension->cancelled().empty());
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning,
                              "fault: [ERROR] Could not get extension context for request identifier 00000000-0000-0000-0000-000000000001",
                              "fault: [ERROR] Could not get proxy object for a request.",
                              "fault: [ERROR] Error registering docuvend extension com.orvane.cellar: " + proxyNotFound.description() + ".",
                              "~ completion"}));
}

TEST_F(RegistrationTest, ACountOfZeroReportsFailureOnTheGlobalQueueAndLogsNothing) {
  provider->registerWithFileCoordinatorRetryCount(0, recorder());
  EXPECT_TRUE(completions.empty()) << "never inside the call";
  EXPECT_EQ(platform.queues.pendingOnGlobalQueue(), 1U);
  EXPECT_EQ(written(), Lines{});
  platform.queues.runAll();
  EXPECT_EQ(completions, std::vector<std::optional<QXError>>{DVPluginOperationFailedError(std::nullopt)});
  EXPECT_EQ(completionLabels, Texts{kFakeGlobalQueueLabel});
  EXPECT_EQ(written(), Lines{"~ completion"});
  EXPECT_EQ(extension->beginCount(), 0);
}

TEST_F(RegistrationTest, ANegativeCountMakesOneTry) {
  extension->failBegins(broken);
  for (const std::int32_t count : {-1, std::numeric_limits<std::int32_t>::min()}) {
    completions.clear();
    written();
    provider->registerWithFileCoordinatorRetryCount(count, recorder());
    EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning, kRequestFailed, kErrorRegistering, "~ completion"})) << count;
    EXPECT_EQ(completions, std::vector<std::optional<QXError>>{broken}) << count;
    EXPECT_EQ(platform.queues.pendingTimers(), 0U) << count;
  }
}

TEST_F(RegistrationTest, RegisteringWithoutCountMakesASingleTry) {
  respondToSetupWith(broken);
  provider->registerWithFileCoordinatorCompletion(recorder());
  EXPECT_EQ(written(), (Lines{kMethod, "~ begin", kBeginning, kFailedToInitialize, "~ completion", "~ cancel 1"}));
  EXPECT_EQ(completions, std::vector<std::optional<QXError>>{broken});
  EXPECT_EQ(platform.queues.pendingTimers(), 0U);
}

TEST_F(RegistrationTest, ARetryWithOneTryLeftOrNoneReportsTheLastErrorAtOnce) {
  for (const std::int32_t count : {1, 0, -5}) {
    completions.clear();
    provider->retryRegisterWithFileCoordinatorRetryCount(count, broken, recorder());
    EXPECT_EQ(completions, std::vector<std::optional<QXError>>{broken}) << count;
    EXPECT_EQ(written(), Lines{"~ completion"}) << count;
  }
  provider->retryRegisterWithFileCoordinatorRetryCount(1, broken, /*completion=*/{});
  EXPECT_EQ(platform.queues.pendingTimers(), 0U);
}

TEST_F(RegistrationTest, AMessageThatIsLostStartsARetryWhileTheFirstTryStillWaits) {
  provider->registerWithFileCoordinatorRetryCount(2, recorder());
  written();
  extension->vendor().failLastDelivery(broken);
  EXPECT_EQ(written(), (Lines{"fault: [ERROR] Error getting remote proxy object for provider extension. Error: TestDomain 7: broken",
                              kErrorRegistering, kOneTryLeft}));
  EXPECT_TRUE(extension->cancelled().empty());
  extension->vendor().answer(0, {QXValue(), QXValue(), QXValue()});
  platform.queues.runAll();
  EXPECT_EQ(completions.size(), 1U);
  platform.queues.advance(2s);
  platform.queues.runAll();
  answerSetup(std::nullopt);
  platform.queues.runAll();
  EXPECT_EQ(completions, (std::vector<std::optional<QXError>>{std::nullopt, std::nullopt})) << "the completion hears of both";
  EXPECT_EQ(platform.fileCoordinator.providers().size(), 2U);
}

TEST_F(RegistrationTest, RegisteringAgainRegistersAgain) {
  FakePlatform::succeedSetup(*extension);
  provider->registerWithFileCoordinatorCompletion(recorder());
  provider->registerWithFileCoordinatorCompletion(recorder());
  platform.queues.runAll();
  EXPECT_EQ(platform.fileCoordinator.providers().size(), 2U);
}

TEST_F(RegistrationTest, UnregisteringIsAnOperationWithoutMessage) {
  FakePlatform::succeedSetup(*extension);
  provider->registerWithFileCoordinatorCompletion(/*completion=*/{});
  platform.queues.runAll();
  written();
  provider->unregisterFromFileCoordinator();
  EXPECT_EQ(platform.queues.pending(kOperationQueue), 1U);
  EXPECT_EQ(platform.fileCoordinator.providers().size(), 1U);
  platform.queues.runAll();
  EXPECT_TRUE(platform.fileCoordinator.providers().empty());
  EXPECT_EQ(platform.fileCoordinator.calls().back(), (FakeFileCoordinator::Call{FakeFileCoordinator::Action::remove, provider}));
  EXPECT_EQ(written(), Lines{});
}

}  // namespace
}  // namespace docuvend
