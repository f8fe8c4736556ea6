// Real processes that knock at a service for unconfined peers alone. Its socket lies where even confined ones see it.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/rpc/LinuxRpcService.h"
#include "tests/launch/PeerTest.h"
#include "tests/wire/Waiting.h"

namespace docuvend::linux_platform {
namespace {

using ::testing::AllOf;
using ::testing::EndsWith;
using ::testing::IsEmpty;
using ::testing::StartsWith;
using ::testing::UnorderedElementsAre;

constexpr const char* kName = "com.example.Inside";

// Notes whom it is offered, and lets everybody go.
class Doorkeeper final : public QXRpcListenerDelegate {
 public:
  bool listener(QXRpcListener& /*listener*/, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) override {
    processes.put(shouldAcceptNewConnection->processIdentifier());
    return false;
  }

  tests::Mailbox<int> processes;
};

class ServiceAudienceTest : public PeerTest {
 protected:
  // The three that knock: each stays connected until the service closes the connection. They wait at the socket before there are threads.
  struct Callers {
    RunningProcess confined;
    RunningProcess nobody;
    RunningProcess unconfined;
  };
  Callers callers() {
    const std::string probe = std::string(DOCUVEND_BIN) + "/docuvend-launch-probe";
    auto confined = ConfinedHouse::start(house_.plan(install("org.a"), {"stay-connected", socketPath_}));
    auto nobody = startProgram({probe, "enter", "once", "stay-connected", socketPath_});
    auto unconfined = startProgram({probe, "stay-connected", socketPath_});
    return {std::move(confined), std::move(nobody), std::move(unconfined)};
  }
  // Serves the callers until all of them are gone.
  void serve(Callers& callers, Audience audience) {
    Reactor reactor(1);
    std::vector<ActivatedSocket> sockets;
    sockets.push_back({kName, socketPath_, std::move(listener_)});
    LinuxRpcService service(reactor, directory_, house_.log.defaultLog(), {{kName, {socketPath_, audience}}}, std::move(sockets));
    const auto listener = service.listenerForService(kName);
    listener->setDelegate(doorkeeper_);
    listener->resume();
    for (RunningProcess* caller : {&callers.confined, &callers.nobody, &callers.unconfined}) EXPECT_EQ(caller->status(), 0);
  }

  LinuxPeerDirectory directory_{bundles_, house_.log.defaultLog()};
  std::shared_ptr<Doorkeeper> doorkeeper_ = std::make_shared<Doorkeeper>();
};

TEST_F(ServiceAudienceTest, OnlyTheUnconfinedProcessComesToTheDelegate) {
  auto three = callers();
  serve(three, Audience::unconfinedPeers);
  EXPECT_EQ(doorkeeper_->processes.count(), 1U);
  EXPECT_EQ(doorkeeper_->processes.take(), three.unconfined.pid());
  const std::string refusing = "[NOTICE] Refusing a connection of PID ";
  EXPECT_THAT(house_.log.texts(QXLogType::defaultType),
              UnorderedElementsAre(
                  AllOf(StartsWith(refusing), EndsWith(": com.example.Inside is not for org.a.")),
                  refusing + std::to_string(three.nobody.pid()) + ": com.example.Inside is not for processes without an identity."));
}

// What makes the test above mean something.
TEST_F(ServiceAudienceTest, AServiceForEveryoneIsOfferedAllThree) {
  auto three = callers();
  serve(three, Audience::everyone);
  EXPECT_EQ(doorkeeper_->processes.count(), 3U);
  EXPECT_THAT(house_.log.texts(QXLogType::defaultType), IsEmpty());
}

}  // namespace
}  // namespace docuvend::linux_platform
