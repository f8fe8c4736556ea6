#include "daemon/DVAdministrationService.h"

#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "acl/DVAccessControlStore.h"
#include "daemon/DVAdministrator.h"
#include "daemon/DVServer.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVAdministration.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {
namespace {

using fake_platform::FakePlatform;
using fake_platform::FakeRpcConnection;

constexpr const char* kService = "com.orvane.Administration";
constexpr int kLocked = 1;

class DVAdministrationServiceTest : public testing::Test {
 protected:
  // The daemon's start, as its entry point makes it.
  void start() {
    server_->setAccessControlStore(DVAccessControlStore::sharedStore());
    service_->start();
    server_->startCompletion(/*completion=*/{});
  }
  std::shared_ptr<FakeRpcConnection> connect() {
    auto connection = FakeRpcConnection::create();
    platform_.rpc.listener(kService)->connect(connection);
    return connection;
  }
  static bool isServed(const std::shared_ptr<FakeRpcConnection>& connection) {
    bool answered = false;
    QXRemote<DVAdministration>(connection->peer())
        .call<&DVAdministration::statusCompletionHandler>([&answered](const auto&, const auto& status) { answered = status.has_value(); });
    return answered;
  }

  FakePlatform platform_;
  std::shared_ptr<DVServer> server_ = std::make_shared<DVServer>();
  std::shared_ptr<DVAdministrationService> service_ = std::make_shared<DVAdministrationService>();
};

TEST_F(DVAdministrationServiceTest, ItsListenerIsMadeUnderItsNameAndHasItAsDelegate) {
  start();
  EXPECT_EQ(platform_.rpc.createdNames(), (std::vector<std::string>{kService, "com.orvane.Docuvend"}));
  EXPECT_EQ(platform_.rpc.listener(kService)->delegate(), service_);
}

TEST_F(DVAdministrationServiceTest, ListensWhenItIsTheDelegate) {
  std::vector<std::string> calls;
  platform_.rpc.setRecorder([&calls](const std::string& call) { calls.push_back(call); });
  service_->start();
  EXPECT_EQ(calls, (std::vector<std::string>{std::string("listenerForService:") + kService, "setDelegate", "resume"}));
}

TEST_F(DVAdministrationServiceTest, ServesWhileTheProvidersAreBeingRegistered) {
  const auto cellar = std::make_shared<fake_platform::FakeExtension>("com.orvane.cellar", 1);
  platform_.installProviderBundle("com.orvane.cellar");
  platform_.adopt(*cellar);
  start();
  platform_.extensionHost.setExtensions({cellar});
  platform_.queues.runAll();
  EXPECT_FALSE(platform_.rpc.listener("com.orvane.Docuvend")->isResumed()) << "the provider's setup hangs";
  EXPECT_TRUE(isServed(connect()));
}

TEST_F(DVAdministrationServiceTest, ServesOnADeviceThatIsLocked) {
  platform_.deviceLock.state = kLocked;
  start();
  EXPECT_TRUE(isServed(connect()));
}

TEST_F(DVAdministrationServiceTest, ItsFirstUnlockBringsTheProviders) {
  platform_.deviceLock.state = kLocked;
  const auto cellar = platform_.installProvider("com.orvane.cellar");
  start();
  platform_.queues.runAll();
  EXPECT_TRUE(platform_.extensionHost.begun().empty());
  std::optional<bool> succeeded;
  QXRemote<DVAdministration>(connect()->peer())
      .call<&DVAdministration::announceFirstUnlockCompletionHandler>([&succeeded](const auto& error) { succeeded = !error; });
  EXPECT_EQ(succeeded, true);
  platform_.queues.runAll();
  EXPECT_EQ(platform_.extensionHost.begun().size(), 1U);
  platform_.extensionHost.setExtensions({cellar});
  platform_.queues.runAll();
  EXPECT_NE(DVExtensionDocuvend::providerWithIdentifier(ProviderID{"com.orvane.cellar"}), nullptr);
}

TEST_F(DVAdministrationServiceTest, EachConnectionHasAnAdministratorOfItsOwnWhichItAloneKeepsAlive) {
  start();
  const auto administratorOf = [](const FakeRpcConnection& connection) {
    const auto exported = std::dynamic_pointer_cast<QXRpcExport<DVAdministration>>(connection.exportedObject());
    return exported ? exported->object() : nullptr;
  };
  const auto one = connect();
  const auto other = connect();
  ASSERT_NE(administratorOf(*one), nullptr);
  EXPECT_NE(administratorOf(*one), administratorOf(*other));
  EXPECT_EQ(one->exportedInterface()->protocolName(), "DVAdministration");
  const std::weak_ptr<DVAdministration> weak = administratorOf(*one);
  one->close();
  EXPECT_TRUE(weak.expired());
}

TEST_F(DVAdministrationServiceTest, AnAdministratorDoesNotKeepItsConnectionAlive) {
  start();
  const std::weak_ptr<FakeRpcConnection> weak = connect();
  EXPECT_TRUE(weak.expired());
}

TEST_F(DVAdministrationServiceTest, ItsConnectionsAreNotLoggedAsClients) {
  start();
  (void)connect();
  EXPECT_EQ(platform_.log.texts(), std::vector<std::string>{"[INFO] Server starting."});
}

}  // namespace
}  // namespace docuvend
