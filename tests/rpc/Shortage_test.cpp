// What a service does when there are no descriptors left to look at a peer with, or none that could be passed on to it.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <unistd.h>

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <variant>

#include "tests/rpc/RpcDrivers.h"
#include "tests/wire/TakingPeer.h"
#include "tests/wire/UsedUpPassing.h"

namespace docuvend::linux_platform {
namespace {

using ::testing::ElementsAre;
using tests::LinuxDriver;
using tests::Mailbox;
using tests::TakingPeer;

const QXRpcOperation kOpen{"open:", {}, {QXValueKind::descriptor}};

UniqueDescriptor nothing() { return UniqueDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC)); }

class Opener final : public QXRpcExportedObject {
 public:
  void invoke(std::size_t, QXArray, QXRpcReply reply) override { reply({QXValue(toValue(nothing()))}); }
};

class Delegate final : public QXRpcListenerDelegate {
 public:
  bool listener(QXRpcListener&, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) override {
    shouldAcceptNewConnection->setExportedInterface({"Test", {kOpen}});
    shouldAcceptNewConnection->setExportedObject(std::make_shared<Opener>());
    shouldAcceptNewConnection->resume();
    return true;
  }
};

class ShortageTest : public testing::Test {
 protected:
  ShortageTest() {
    listener_->setDelegate(delegate_);
    listener_->resume();
  }
  [[nodiscard]] TakingPeer connect() const {
    TakingPeer peer(std::get<UniqueDescriptor>(connectToSocket(driver_.socketPath)));
    peer.sayHello();
    return peer;
  }
  void expectServed() const {
    auto peer = connect();
    ASSERT_TRUE(peer.take<Hello>());
    EXPECT_TRUE(askForAFile(peer));
    EXPECT_TRUE(peer.take<ReplyFrame>());
  }
  static bool askForAFile(const TakingPeer& peer) { return peer.write(Frame(RequestFrame{1, true, kOpen.name, {}})); }

  LinuxDriver driver_;
  const std::shared_ptr<Delegate> delegate_ = std::make_shared<Delegate>();
  const std::shared_ptr<QXRpcListener> listener_ = driver_.listener();
};

TEST_F(ShortageTest, APeerThatCannotBeLookedAtIsTurnedAwayUntilItCanAndServedAsNobodyNever) {
  driver_.peers.setCanLook(false);
  for (int i = 0; i < 2; ++i) {
    auto peer = connect();
    ASSERT_TRUE(peer.take<Hello>());
    const auto end = peer.take<EndFrame>();
    ASSERT_TRUE(end);
    EXPECT_EQ(end->error.domain, kQXRpcErrorDomain);
    EXPECT_EQ(end->error.code, static_cast<std::int64_t>(QXRpcErrorCode::tooManyCalls));
    EXPECT_EQ(end->error.texts.at("description"), "no descriptors are left to see who connects with");
  }
  driver_.peers.setCanLook(true);
  expectServed();
  const fake_platform::FakeLogEntry line{QXLogType::defaultType,
                                         "[NOTICE] Refusing connections: cannot look at who connects: Too many open files"};
  EXPECT_THAT(driver_.log.entries(), ElementsAre(line)) << "once";
  driver_.peers.setCanLook(false);
  auto again = connect();
  ASSERT_TRUE(again.take<Hello>());
  EXPECT_TRUE(again.take<EndFrame>());
  EXPECT_THAT(driver_.log.entries(), ElementsAre(line, line)) << "and once more after it was over";
}

// They lie unread in another program's sockets.
TEST_F(ShortageTest, APeerToWhichTheSystemPassesNoFileOnIsToldSoAndSoIsTheUser) {
  auto peer = connect();
  ASSERT_TRUE(peer.take<Hello>());
  std::optional<tests::UsedUpPassing> usedUp(std::in_place);
  const bool isAsked = askForAFile(peer);
  const auto failure = peer.take<FailureFrame>();
  usedUp.reset();
  ASSERT_TRUE(isAsked);
  ASSERT_TRUE(failure);
  EXPECT_EQ(failure->error.code, static_cast<std::int64_t>(QXRpcErrorCode::tooManyCalls));
  expectServed();
  EXPECT_THAT(driver_.log.entries(),
              ElementsAre(fake_platform::FakeLogEntry{QXLogType::fault,
                                                      "[ERROR] PID " + std::to_string(::getpid()) +
                                                          " was not given an open file: too many of this user's lie unread in sockets."}));
}

}  // namespace
}  // namespace docuvend::linux_platform
