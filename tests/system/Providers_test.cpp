// Providers that fail in the middle of a request: an error for whoever waits, and another try finds a new process.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <future>

#include "common/DVErrors.h"
#include "platform/rpc_errors.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

const ProviderID kTricksterID{kTrickster};
const ConsumerID kPickerID{kPicker};

class Providers : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    house_.install(kCellar);
    house_.install(kEditor);
    house_.install(kPicker);
    house_.installTrickster();
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
    house_.startDaemon();
    caller_ = house_.client(kPicker);
  }

  QXURL item(const std::string& name) const { return QXURL::fileURL(house_.storage(kTrickster) + "/" + name, QXURLKind::file); }
  std::optional<QXError> grant(const std::string& name) {
    return errorOf(caller_->ask<&DVDaemon::extendSandboxForFileURL>(item(name), kTricksterID, kPickerID));
  }
  static void expectFailed(const std::optional<QXError>& error) {
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, kDVErrorDomain);
    EXPECT_EQ(error->code, static_cast<std::int64_t>(DVErrorCode::pluginOperationFailed)) << error->description();
    EXPECT_TRUE(error->underlying);
  }

  std::string letter_;
  std::unique_ptr<Client> caller_;
};

TEST_F(Providers, OneThatIsKilledInTheMiddleOfARequestIsAnErrorAndWorksAtTheNextTry) {
  ASSERT_EQ(grant("stuck"), std::nullopt);
  auto answer = std::async(std::launch::async, [this] {
    return errorOf(caller_->ask<&DVDaemon::startProvidingItemAtURL>(item("stuck"), kTricksterID, kPickerID));
  });
  ASSERT_TRUE(house_.awaitLog("is stuck"));
  const auto processes = house_.processesOf("docuvend-trickster");
  ASSERT_EQ(processes.size(), 1U);
  ASSERT_EQ(::kill(processes.front(), SIGKILL), 0);
  ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
  expectFailed(answer.get());
  EXPECT_EQ(house_.loggedBeginning("[ERROR] Error getting remote proxy object for provider extension. Error: "), 1);
  EXPECT_EQ(house_.loggedBeginning("[ERROR] Cannot provide item at URL " + item("stuck").absoluteString() +
                                   " for extension com.orvane.trickster. Error: "),
            1);

  writeFile(house_.container(kTrickster) + "/free", "");
  EXPECT_EQ(errorOf(caller_->ask<&DVDaemon::startProvidingItemAtURL>(item("stuck"), kTricksterID, kPickerID)), std::nullopt);
}

TEST_F(Providers, OneThatIsStuckHoldsUpNeitherItsOtherItemsNorOtherProviders) {
  ASSERT_EQ(grant("stuck"), std::nullopt);
  auto answer = std::async(std::launch::async, [this] {
    return errorOf(house_.client(kPicker)->ask<&DVDaemon::startProvidingItemAtURL>(item("stuck"), kTricksterID, kPickerID));
  });
  ASSERT_TRUE(house_.awaitLog("is stuck"));
  EXPECT_EQ(grant("other"), std::nullopt);
  EXPECT_EQ(errorOf(caller_->ask<&DVDaemon::startProvidingItemAtURL>(item("other"), kTricksterID, kPickerID)), std::nullopt);
  const std::string string = house_.granted(letter_, kEditor);
  EXPECT_EQ(house_.confined(kEditor, {"show", string}).output, "Dear all\n");
  writeFile(house_.container(kTrickster) + "/free", "");
  ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
  EXPECT_EQ(answer.get(), std::nullopt);
}

TEST_F(Providers, OneThatAbortsWhileItNamesAnItemIsAnError) {
  expectFailed(grant("abort"));
  EXPECT_EQ(house_.loggedBeginning("[ERROR] Cannot get item ID for URL " + item("abort").absoluteString() +
                                   " for extension com.orvane.trickster. Error: "),
            1);
  EXPECT_THAT(house_.accessControl(), Not(HasSubstr("abort")));
  EXPECT_EQ(grant("other"), std::nullopt);
}

TEST_F(Providers, AnIdentifierThatAPropertyListCannotCarryIsRefused) {
  expectFailed(grant("control"));
  EXPECT_EQ(house_.accessControl(), "");
  EXPECT_EQ(grant("other"), std::nullopt);
}

TEST_F(Providers, OneThatSendsBytesThatAreNoFrameIsDroppedWithOneLine) {
  expectFailed(grant("garbage"));
  EXPECT_EQ(house_.logged("[ERROR] Error getting remote proxy object for provider extension. Error: QXRpcErrorDomain 6: a frame of "
                          "4294967295 bytes"),
            1);
  EXPECT_EQ(grant("other"), std::nullopt);
}

TEST_F(Providers, OneThatCrashesWhileItFetchesIsAnErrorAndTheNextTryReadsTheWholeDocument) {
  const std::string string = house_.granted(letter_, kEditor);
  writeFile(house_.container(kCellar) + "/crash-once", "");
  const Ending failed = house_.confined(kEditor, {"show", string});
  EXPECT_EQ(failed.status, 1);
  EXPECT_EQ(failed.output, "");
  EXPECT_THAT(failed.errors, HasSubstr(DVPluginOperationFailedError(std::nullopt).description()));
  EXPECT_EQ(house_.confined(kEditor, {"show", string}).output, "Dear all\n");
}

TEST_F(Providers, OneThatIsIdleIsStartedAgainAfterItWasKilled) {
  ASSERT_EQ(grant("one"), std::nullopt);
  const auto processes = house_.processesOf("docuvend-trickster");
  ASSERT_EQ(processes.size(), 1U);
  ASSERT_EQ(::kill(processes.front(), SIGKILL), 0);
  eventually("it has ended", [this] { return house_.processesOf("docuvend-trickster").empty(); });
  eventually("it is started again", [this] { return grant("two") == std::nullopt; });
}

}  // namespace
}  // namespace docuvend::tests
