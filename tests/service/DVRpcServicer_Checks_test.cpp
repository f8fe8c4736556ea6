#include <array>
#include <utility>

#include "tests/service/AskedConnection.h"
#include "tests/service/ServicerFixture.h"

namespace docuvend {
namespace {

using fake_platform::FakeLogSwitch;
using fake_platform::FakeRpcConnection;
using fake_platform::FakeSandbox;

constexpr std::array kWriteOnly = {kDVWriteEntitlement};
constexpr std::array kReadOrWrite = {kDVReadEntitlement, kDVWriteEntitlement};

using DVRpcServicerChecksTest = ServicerFixture;

TEST_F(DVRpcServicerChecksTest, TheEntitlementsHaveTheirNames) {
  EXPECT_EQ(kDVReadEntitlement, "com.orvane.docuvend.acl-read");
  EXPECT_EQ(kDVWriteEntitlement, "com.orvane.docuvend.acl-write");
}

TEST_F(DVRpcServicerChecksTest, ANumberThatIsTrueIsHeld) {
  for (const QXValue& value : std::vector<QXValue>{true, 1, -1, 2, 0.5}) {
    connection_->setEntitlement("com.orvane.docuvend.acl-write", value);
    EXPECT_TRUE(servicer_->clientHasOneOfAllowedEntitlements(kWriteOnly)) << value.description();
  }
  EXPECT_TRUE(platform_.log.entries().empty());
}

TEST_F(DVRpcServicerChecksTest, NoOtherValueIsHeldWhateverItSays) {
  for (const QXValue& value : std::vector<QXValue>{false, 0, 0.0, "true", "1", "YES", QXArray{true}, QXDictionary{{"a", true}},
                                                   QXData::fromText("1"), QXValue()}) {
    connection_->setEntitlement("com.orvane.docuvend.acl-write", value);
    platform_.log.clear();
    EXPECT_FALSE(servicer_->clientHasOneOfAllowedEntitlements(kWriteOnly)) << value.description();
    EXPECT_EQ(logged(), (Entries{{QXLogType::fault,
                                  "[ERROR] Rejecting request from PID 4711 because it does not have any of these entitlements: "
                                  "(\"com.orvane.docuvend.acl-write\")"}}));
  }
}

TEST_F(DVRpcServicerChecksTest, OneOfTheListIsEnough) {
  entitle(kDVWriteEntitlement);
  EXPECT_TRUE(servicer_->clientHasOneOfAllowedEntitlements(kReadOrWrite));
  EXPECT_TRUE(platform_.log.entries().empty());
}

TEST_F(DVRpcServicerChecksTest, AReaderIsNoWriterAndTheLineNamesTheWholeList) {
  entitle(kDVReadEntitlement);
  EXPECT_FALSE(servicer_->clientHasOneOfAllowedEntitlements(kWriteOnly));
  EXPECT_TRUE(servicer_->clientHasOneOfAllowedEntitlements(kReadOrWrite));
  EXPECT_EQ(logged(), (Entries{{QXLogType::fault,
                                "[ERROR] Rejecting request from PID 4711 because it does not have any of these entitlements: "
                                "(\"com.orvane.docuvend.acl-write\")"}}));
}

TEST_F(DVRpcServicerChecksTest, AClientWithNeitherIsRefusedWithBothNamed) {
  EXPECT_FALSE(servicer_->clientHasOneOfAllowedEntitlements(kReadOrWrite));
  EXPECT_EQ(logged(), (Entries{{QXLogType::fault,
                                "[ERROR] Rejecting request from PID 4711 because it does not have any of these entitlements: "
                                "(\"com.orvane.docuvend.acl-read\", \"com.orvane.docuvend.acl-write\")"}}));
}

TEST_F(DVRpcServicerChecksTest, AnEmptyListRefusesEverybody) {
  entitle(kDVWriteEntitlement);
  EXPECT_FALSE(servicer_->clientHasOneOfAllowedEntitlements({}));
  EXPECT_EQ(
      logged(),
      (Entries{{QXLogType::fault, "[ERROR] Rejecting request from PID 4711 because it does not have any of these entitlements: ()"}}));
}

TEST_F(DVRpcServicerChecksTest, AClientThatHasGoneHoldsNothingAndHasNoPid) {
  entitle(kDVWriteEntitlement);
  letConnectionGo();
  EXPECT_FALSE(servicer_->clientHasOneOfAllowedEntitlements(kWriteOnly));
  EXPECT_EQ(logged(), (Entries{{QXLogType::fault,
                                "[ERROR] Rejecting request from PID 0 because it does not have any of these entitlements: "
                                "(\"com.orvane.docuvend.acl-write\")"}}));
}

TEST_F(DVRpcServicerChecksTest, AsksInTheListsOrderAndNotBeyondTheFirstThatIsHeld) {
  static constexpr std::array<std::string_view, 3> kList = {"a", "b", "c"};
  const auto connection = std::make_shared<AskedConnection>("b");
  const auto servicer = std::make_shared<DVRpcServicer>(source_, connection);
  EXPECT_TRUE(servicer->clientHasOneOfAllowedEntitlements(kList));
  EXPECT_EQ(connection->asked, (std::vector<std::string>{"a", "b"}));
}

// --- Access to a file

TEST_F(DVRpcServicerChecksTest, AsksWhetherTheClientCouldWriteTheFilesData) {
  platform_.sandbox.setAnswer(FakeSandbox::kAllowed);
  EXPECT_TRUE(servicer_->clientHasSandboxAccessToFile(kReport));
  EXPECT_EQ(platform_.sandbox.checks(), (std::vector<FakeSandbox::Check>{{token_, "file-write-data", kReportPath}}));
}

TEST_F(DVRpcServicerChecksTest, AsksAboutTheDecodedPath) {
  (void)servicer_->clientHasSandboxAccessToFile(*QXURL::fromString("file:///a%20b/c%2Fd/"));
  ASSERT_EQ(platform_.sandbox.checks().size(), 1U);
  EXPECT_EQ(platform_.sandbox.checks()[0].path, "/a b/c/d");
}

TEST_F(DVRpcServicerChecksTest, AnyAnswerButZeroIsARefusal) {
  for (const int code : {1, -1, 2, 13}) {
    platform_.sandbox.setAnswer(code);
    EXPECT_FALSE(servicer_->clientHasSandboxAccessToFile(kReport)) << code;
  }
  EXPECT_TRUE(platform_.log.entries().empty());
}

TEST_F(DVRpcServicerChecksTest, AClientThatHasGoneIsAskedAboutWithTheZeroToken) {
  platform_.sandbox.setAnswer(FakeSandbox::kAllowed);
  letConnectionGo();
  EXPECT_FALSE(servicer_->clientHasSandboxAccessToFile(kReport));
  ASSERT_EQ(platform_.sandbox.checks().size(), 1U);
  EXPECT_EQ(platform_.sandbox.checks()[0].token, QXAuditToken{});
}

TEST_F(DVRpcServicerChecksTest, AClientThatHasGoneHasTheAccessThatTheSandboxGivesToTheZeroToken) {
  platform_.sandbox.setZeroTokensAnswer(FakeSandbox::kAllowed);
  letConnectionGo();
  EXPECT_TRUE(servicer_->clientHasSandboxAccessToFile(kReport));
}

// --- Waking up

TEST_F(DVRpcServicerChecksTest, WakingAnswersAnyClientOnTheGlobalQueue) {
  std::vector<std::string> queues;
  servicer_->wakeUpCompletion([&] { queues.push_back(platform_.queues.currentLabel()); });
  EXPECT_TRUE(queues.empty());
  EXPECT_EQ(submittedAtLastLine_, 0U);
  platform_.queues.runAll();
  EXPECT_EQ(queues, std::vector<std::string>{fake_platform::kFakeGlobalQueueLabel});
  EXPECT_EQ(platform_.log.entries(), (Entries{{QXLogType::debug, "[DEBUG] Serving: wakeUpCompletion:"}}));
}

TEST_F(DVRpcServicerChecksTest, WakingChecksNothing) {
  const auto connection = std::make_shared<AskedConnection>("a");
  const auto servicer = std::make_shared<DVRpcServicer>(source_, connection);
  servicer->wakeUpCompletion([] {});
  platform_.queues.runAll();
  EXPECT_TRUE(connection->asked.empty());
  EXPECT_TRUE(platform_.sandbox.checks().empty());
  EXPECT_EQ(platform_.applicationRegistry.tokenQueryCount(), 0);
}

TEST_F(DVRpcServicerChecksTest, WakingWithoutAReplyHandlerIsATaskThatCallsNothing) {
  servicer_->wakeUpCompletion(/*completion=*/{});
  EXPECT_EQ(platform_.queues.pendingOnGlobalQueue(), 1U);
  platform_.queues.runAll();
}

TEST_F(DVRpcServicerChecksTest, ServingIsNotFormattedWithoutDebugLogging) {
  platform_.log.setEnabled(QXLogType::debug, FakeLogSwitch::off);
  servicer_->wakeUpCompletion([] {});
  EXPECT_EQ(platform_.log.writes(), 0U);
}

// --- References

TEST_F(DVRpcServicerChecksTest, HoldsItsServerAndItsConnectionWeakly) {
  EXPECT_EQ(servicer_->server(), source_);
  EXPECT_EQ(servicer_->connection(), connection_);
  source_.reset();
  connection_.reset();
  EXPECT_EQ(servicer_->server(), nullptr);
  EXPECT_EQ(servicer_->connection(), nullptr);
}

}  // namespace
}  // namespace docuvend
