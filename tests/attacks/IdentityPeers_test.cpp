// To be taken for somebody else through a connection: by dying, by handing it on, or by leaving one's number to another process.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include "platform/linux/wire/ConnectToSocket.h"
#include "tests/attacks/TwoApplications.h"
#include "tests/attacks/handing.h"
#include "tests/attacks/told.h"

namespace docuvend::tests {
namespace {

class PeerAttacks : public TwoApplications {
 protected:
  // Hands a connection to the attacker's next launch, which says those words over it; what it prints.
  [[nodiscard]] Lines attackOver(linux_platform::UniqueDescriptor connection, const Lines& words) const {
    const auto listener = listenAt(hatch(house_));
    Process process(
        {joined({std::string(DOCUVEND_BIN) + "/docuvend-run", kAttacker, "take-over", hatch(house_)}, words), house_.environment(), {}});
    const auto hand = acceptAt(listener);
    EXPECT_TRUE(handOver(hand.get(), connection.get()));
    connection.reset();
    const Ending ending = process.wait();
    EXPECT_EQ(ending.status, 0) << ending.errors;
    return {ending.output.substr(0, ending.output.find('\n')), ending.output.substr(ending.output.find('\n') + 1)};
  }
  [[nodiscard]] linux_platform::UniqueDescriptor connectionOfATest() const {
    return std::get<linux_platform::UniqueDescriptor>(linux_platform::connectToSocket(house_.publicSocket(kDVServiceName)));
  }
};

TEST_F(PeerAttacks, AConnectionWhoseMakerHasDiedBeforeItWasLookedAtIsNobodys) {
  house_.daemon().signal(SIGSTOP);
  Accomplice dead(house_, {"connect-and-die", kDVServiceName});
  auto orphaned = dead.connection();
  house_.daemon().signal(SIGCONT);
  Client connection(std::move(orphaned));
  EXPECT_EQ(whoIsAt(connection), kIsNobody);
  EXPECT_EQ(house_.loggedContaining(" is nobody: "), 1);
  EXPECT_EQ(dead.end().output, "ok\nok\n");

  Accomplice alive(house_, {"connect", kDVServiceName});
  Client honest(alive.connection());
  EXPECT_EQ(whoIsAt(honest), kIsAttacker);
}

TEST_F(PeerAttacks, AConfinedApplicationsConnectionInUnconfinedHandsIsStillItsOwn) {
  Accomplice accomplice(house_, {"connect", kDVServiceName});
  Client connection(accomplice.connection());
  EXPECT_EQ(whoIsAt(connection), kIsAttacker);

  Accomplice another(house_, {"connect", kDVServiceName});
  Client declared(another.connection(), kVictim);
  EXPECT_EQ(whoIsAt(declared), (Lines{"QXRpcErrorDomain 9", "QXRpcErrorDomain 9"}));
  EXPECT_EQ(house_.loggedContaining(" declares itself to be "), 0);
  EXPECT_EQ(whoIsAt(*house_.client(kVictim)), kIsVictim);
}

TEST_F(PeerAttacks, AConnectionHandedIntoAConfinementGivesWhatItsMakerHasAndNoMore) {
  const Lines askForTheOther = {"ask", others_};
  EXPECT_EQ(attackOver(connectionOfATest(), askForTheOther), (Lines{"ok", "DVErrorDomain 2\n"}));
  // Its maker is not confined and may declare any bundle; this is what the kernel lets whoever has a connection do.
  EXPECT_EQ(attackOver(connectionOfATest(), {"ask-as", kVictim, others_}), (Lines{"ok", "ok\n"}));
  // What comes after the request over it is over the attacker's own.
  EXPECT_EQ(refusalsOf(kAttacker), 0);
  EXPECT_EQ(attackOver(connectionOfATest(), {"ask", others_, "ask", others_}), (Lines{"ok", "DVErrorDomain 2\nDVErrorDomain 2\n"}));
  EXPECT_EQ(refusalsOf(kAttacker), 1);
}

}  // namespace
}  // namespace docuvend::tests
