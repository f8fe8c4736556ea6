#include "tests/service/ServicerFixture.h"

namespace docuvend {
namespace {

using fake_platform::FakeLogSwitch;
using fake_platform::FakePlatform;

constexpr const char* kServing = "[DEBUG] Serving: providersCompletionHandler:";

using DVRpcServicerListingTest = ServicerFixture;

QXDictionary infoOf(const std::string& provider) {
  return {{"documentStorageURL", FakePlatform::storageURL(provider)}, {"providerIdentifier", provider}};
}

TEST_F(DVRpcServicerListingTest, AReaderGetsTheWholeList) {
  registerProviders();
  entitle(kDVReadEntitlement);
  servicer_->providersCompletionHandler(providersReply());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing}}));
  const Answer& answer = earlyAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  const QXDictionary providers = {{kCellar.value, infoOf(kCellar.value)}, {kAttic.value, infoOf(kAttic.value)}};
  EXPECT_EQ(answer.providers, providers);
  EXPECT_EQ(logged(),
            (Entries{{QXLogType::debug, kServing},
                     {QXLogType::debug, "[DEBUG] providersCompletionHandler:: returning providers " + QXValue(providers).description()}}));
}

TEST_F(DVRpcServicerListingTest, AWriterGetsItToo) {
  registerProviders();
  entitle(kDVWriteEntitlement);
  servicer_->providersCompletionHandler(providersReply());
  EXPECT_EQ(earlyAnswer().providers->size(), 2U);
}

TEST_F(DVRpcServicerListingTest, TheListIsTheSameWhateverTheCallerWasGranted) {
  registerProviders();
  entitle(kDVReadEntitlement);
  grant(kCellar, kItem, kEditor);
  servicer_->providersCompletionHandler(providersReply());
  EXPECT_EQ(earlyAnswer().providers->size(), 2U);
}

TEST_F(DVRpcServicerListingTest, BeforeDiscoveryTheListIsEmptyAndNoError) {
  entitle(kDVReadEntitlement);
  servicer_->providersCompletionHandler(providersReply());
  const Answer& answer = earlyAnswer();
  EXPECT_EQ(answer.error, std::nullopt);
  EXPECT_EQ(answer.providers, QXDictionary());
}

TEST_F(DVRpcServicerListingTest, TheListIsTakenWhenItIsAskedFor) {
  registerProviders();
  entitle(kDVReadEntitlement);
  servicer_->providersCompletionHandler(providersReply());
  DVExtensionDocuvend::providerWithIdentifier(kCellar)->setProvidedItemsURL(std::nullopt);
  EXPECT_EQ(DVExtensionDocuvend::providersInfo()[kCellar.value], QXValue(QXDictionary()));
  platform_.queues.runAll();
  ASSERT_EQ(answers_.size(), 1U);
  const QXDictionary taken = {{kCellar.value, infoOf(kCellar.value)}, {kAttic.value, infoOf(kAttic.value)}};
  EXPECT_EQ(answers_[0].providers, taken);
  EXPECT_EQ(logged().back(), (fake_platform::FakeLogEntry{QXLogType::debug, "[DEBUG] providersCompletionHandler:: returning providers " +
                                                                                QXValue(taken).description()}));
}

TEST_F(DVRpcServicerListingTest, AProviderWithoutADirectoryIsListedWithoutInformation) {
  registerProviders();
  entitle(kDVReadEntitlement);
  DVExtensionDocuvend::providerWithIdentifier(kCellar)->setProvidedItemsURL(std::nullopt);
  servicer_->providersCompletionHandler(providersReply());
  platform_.queues.runAll();
  ASSERT_EQ(answers_.size(), 1U);
  EXPECT_EQ((*answers_[0].providers)[kCellar.value], QXValue(QXDictionary()));
}

TEST_F(DVRpcServicerListingTest, AsksNoExtension) {
  registerProviders();
  entitle(kDVReadEntitlement);
  servicer_->providersCompletionHandler(providersReply());
  platform_.queues.runAll();
  EXPECT_EQ(cellar_->vendor().messages().size(), 1U);  // its initial setup
}

TEST_F(DVRpcServicerListingTest, WithoutAReplyHandlerTheTaskStillLogs) {
  entitle(kDVReadEntitlement);
  servicer_->providersCompletionHandler(/*completionHandler=*/{});
  EXPECT_EQ(platform_.queues.pendingOnGlobalQueue(), 1U);
  platform_.queues.runAll();
  EXPECT_EQ(logged().back(),
            (fake_platform::FakeLogEntry{QXLogType::debug, "[DEBUG] providersCompletionHandler:: returning providers {}"}));
}

TEST_F(DVRpcServicerListingTest, AClientWithNeitherEntitlementIsRefusedAndThatIsLoggedForDebugging) {
  registerProviders();
  servicer_->providersCompletionHandler(providersReply());
  const Answer& answer = earlyAnswer();
  EXPECT_EQ(answer.error, DVClientLacksEntitlement());
  EXPECT_TRUE(answer.hasNoValue());
  EXPECT_EQ(logged(), (Entries{{QXLogType::debug, kServing},
                               {QXLogType::fault,
                                "[ERROR] Rejecting request from PID 4711 because it does not have any of these entitlements: "
                                "(\"com.orvane.docuvend.acl-read\", \"com.orvane.docuvend.acl-write\")"},
                               {QXLogType::debug, "[DEBUG] providersCompletionHandler:: Client is missing entitlement"}}));
}

TEST_F(DVRpcServicerListingTest, ARefusedClientThatWantsNoReplyCausesNoTask) {
  servicer_->providersCompletionHandler(/*completionHandler=*/{});
  EXPECT_EQ(logged().back().text, "[DEBUG] providersCompletionHandler:: Client is missing entitlement");
  EXPECT_EQ(platform_.queues.pending(), 0U);
}

TEST_F(DVRpcServicerListingTest, WithoutDebugLoggingNothingIsWrittenOnSuccess) {
  platform_.log.setEnabled(QXLogType::debug, FakeLogSwitch::off);
  entitle(kDVReadEntitlement);
  servicer_->providersCompletionHandler(providersReply());
  EXPECT_EQ(earlyAnswer().error, std::nullopt);
  EXPECT_EQ(platform_.log.writes(), 0U);
}

}  // namespace
}  // namespace docuvend
