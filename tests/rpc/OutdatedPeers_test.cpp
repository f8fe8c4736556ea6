// What becomes of the connections of peers that are not what they were any more.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "tests/rpc/RpcDrivers.h"
#include "tests/rpc/TestProtocol.h"
#include "tests/wire/Waiting.h"

namespace docuvend::linux_platform {
namespace {

using tests::LinuxDriver;
using tests::Mailbox;
using tests::TestObject;
using tests::TestProtocol;

// Serves the test protocol to everybody, and counts them.
class Delegate final : public QXRpcListenerDelegate {
 public:
  bool listener(QXRpcListener&, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) override {
    shouldAcceptNewConnection->setExportedInterface(qxInterfaceOf<TestProtocol>());
    shouldAcceptNewConnection->setExportedObject(std::make_shared<QXRpcExport<TestProtocol>>(std::make_shared<TestObject>()));
    shouldAcceptNewConnection->resume();
    heard.put(true);
    return true;
  }

  Mailbox<bool> heard;
};

class OutdatedPeersTest : public testing::Test {
 protected:
  void SetUp() override {
    listener_->setDelegate(delegate_);
    listener_->resume();
  }
  // Whose it is is looked at when it is admitted: it has been, when it was served.
  [[nodiscard]] LinuxDriver::Client connectAs(Standing standing, std::optional<std::string> bundle) {
    driver_.peers.setNextPeer(standing, std::move(bundle), {});
    return driver_.connect({}, [this](const QXError& reason) { closed_.put(reason); });
  }
  [[nodiscard]] static bool isServed(const LinuxDriver::Client& client) {
    Mailbox<bool> answered;
    QXRemote<TestProtocol>(client.proxy([&answered](const QXError&) { answered.put(false); })).call<&TestProtocol::ping>([&answered] {
      answered.put(true);
    });
    return answered.take() == true;
  }
  void expectRefused() {
    const auto reason = closed_.take();
    ASSERT_TRUE(reason);
    EXPECT_EQ(reason->domain, kQXRpcErrorDomain);
    EXPECT_EQ(reason->code, static_cast<std::int64_t>(QXRpcErrorCode::refused));
    EXPECT_THAT(reason->description(), testing::HasSubstr("its bundle org.a was removed or replaced"));
  }

  const std::shared_ptr<Delegate> delegate_ = std::make_shared<Delegate>();
  Mailbox<QXError> closed_;
  LinuxDriver driver_;
  const std::shared_ptr<QXRpcListener> listener_ = driver_.listener();
};

TEST_F(OutdatedPeersTest, LoseTheirConnectionsWithAReasonWhenItIsSaidAndNobodyElseDoes) {
  const auto outdated = connectAs(Standing::confined, "org.a");
  ASSERT_TRUE(isServed(outdated));
  const auto other = connectAs(Standing::confined, "org.b");
  ASSERT_TRUE(isServed(other));
  const auto unconfined = connectAs(Standing::unconfined, std::nullopt);
  ASSERT_TRUE(isServed(unconfined));
  const auto nobody = connectAs(Standing::nobody, std::nullopt);
  ASSERT_TRUE(isServed(nobody));
  driver_.service.endOutdatedConnections();
  EXPECT_TRUE(isServed(outdated)) << "nothing was replaced";
  driver_.peers.replace("org.a");
  EXPECT_TRUE(isServed(outdated)) << "nobody has said so";
  driver_.service.endOutdatedConnections();
  expectRefused();
  EXPECT_THAT(driver_.log.entries(), testing::ElementsAre(fake_platform::FakeLogEntry{
                                         QXLogType::defaultType, "[NOTICE] Closing the connection of PID " + std::to_string(::getpid()) +
                                                                     ": its bundle org.a was removed or replaced."}));
  EXPECT_FALSE(isServed(outdated));
  for (const auto* client : {&other, &unconfined, &nobody}) EXPECT_TRUE(isServed(*client));
}

// One that was looked at before its bundle went, and is admitted when the connections of that bundle's have been ended.
TEST_F(OutdatedPeersTest, AreNotServedWhenTheirBundleIsReplacedWhileTheyConnect) {
  driver_.peers.replace("org.a");
  const auto outdated = connectAs(Standing::confined, "org.a");
  expectRefused();
  EXPECT_FALSE(isServed(outdated));
  const auto other = connectAs(Standing::confined, "org.b");
  EXPECT_TRUE(isServed(other));
  EXPECT_TRUE(delegate_->heard.take());
  EXPECT_EQ(delegate_->heard.count(), 0U) << "the service does not hear of the first";
}

TEST_F(OutdatedPeersTest, OfAServiceThatIsGoneThereIsNothingToEnd) {
  LinuxDriver gone;
  gone.listener().reset();
  gone.service.endOutdatedConnections();
}

}  // namespace
}  // namespace docuvend::linux_platform
