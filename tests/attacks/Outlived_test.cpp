// A process that lives on when its bundle is gone, to be the next bundle of that identifier: with its entitlements, and what is granted to
// it.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <memory>

#include "tests/attacks/TwoApplications.h"
#include "tests/attacks/told.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::Each;
using ::testing::StartsWith;

const std::string kWrite = "com.orvane.docuvend.acl-write";

class Outlived : public TwoApplications {
 protected:
  void SetUp() override {
    TwoApplications::SetUp();
    if (HasFatalFailure()) return;
    later_ = house_.putInCloud("later.txt", "for the new one\n");
    fs::copy(house_.bundles() + "/" + kAttacker, next_, fs::copy_options::recursive);
    writeFile(next_ + "/Entitlements.plist", propertyList(trueEntry(kWrite)));
  }
  void ctl(const Lines& words) const {
    const Ending ending = house_.ctl(words);
    EXPECT_EQ(ending.status, 0) << ending.errors;
  }
  // An attacker that says who it is, and when it is let go again, over new connections; then it tries what only the next bundle may.
  [[nodiscard]] std::unique_ptr<Process> startAttacker() const {
    Lines words = joined({std::string(DOCUVEND_BIN) + "/docuvend-run", kAttacker}, whoAmI());
    words = joined(joined(std::move(words), {"hold", "past"}), whoAmI());
    words = joined(std::move(words), {"grant", othersPath_, kCellar, kAttacker, "ask", house_.bookmark(later_)});
    auto process = std::make_unique<Process>(Command{words, house_.environment(), {}});
    eventually("the attacker waits",
               [this, &process] { return fs::exists(house_.container(kAttacker) + "/past.holding") || !process->isRunning(); });
    return process;
  }
  void expectNothingFor(Process& attacker) const {
    writeFile(house_.container(kAttacker) + "/past.go", "");
    const Ending& ending = attacker.wait();
    EXPECT_EQ(ending.status, 0) << ending.errors;
    EXPECT_EQ(docuvend::tests::linesOf(ending.output),
              joined(joined(kIsAttacker, {"ok"}), joined(kIsNobody, {"QXRpcErrorDomain 10", "QXRpcErrorDomain 10"})));
    EXPECT_GT(house_.loggedContaining(" was started from another bundle " + kAttacker +
                                      " than the one that is installed now; it is to be started again."),
              0);
  }
  // What is true whichever way the next one comes: the first one's process is nobody, over the connection that it has and over new ones,
  // and a process of the next one is that.
  void tryToOutlive(const std::function<void()>& replace) {
    const auto attacker = startAttacker();
    Accomplice early(house_, {"connect", kDVServiceName});
    Client connection(early.connection());
    EXPECT_EQ(whoIsAt(connection), kIsAttacker);
    replace();
    eventually("the next one is known", [this] { return attack({"providers"}) == Lines{"ok"}; });
    eventually("the first one's connection has ended", [this, &connection] { return whoIsAt(connection) != kIsAttacker; });
    EXPECT_TRUE(house_.awaitLog(": its bundle " + kAttacker + " was removed or replaced."));
    const std::string string = house_.granted(later_, kAttacker);
    EXPECT_EQ(attack({"ask", string}), Lines{"ok"});
    EXPECT_THAT(whoIsAt(connection), Each(StartsWith("QXRpcErrorDomain ")));
    const std::string before = house_.accessControl();
    expectNothingFor(*attacker);
    EXPECT_EQ(house_.accessControl(), before);
    EXPECT_EQ(attack(whoAmI()), kIsAttacker);
    EXPECT_EQ(attack({"grant", othersPath_, kCellar, kAttacker}), Lines{"ok"});
  }

  std::string later_;
  const std::string next_ = house_.home() + "/next";
};

TEST_F(Outlived, AProcessIsNotTheBundleThatIsInstalledWhenItsOwnIsRemoved) {
  tryToOutlive([this] {
    ctl({"uninstall", kAttacker});
    ctl({"install", next_});
  });
}

TEST_F(Outlived, AProcessIsNotTheBundleThatIsInstalledOverItsOwn) {
  tryToOutlive([this] { ctl({"install", next_}); });
}

TEST_F(Outlived, AProcessIsNotTheBundleThatWasPutInItsOwnsPlaceByHand) {
  tryToOutlive([this] {
    fs::rename(house_.bundles() + "/" + kAttacker, house_.home() + "/old");
    fs::rename(next_, house_.bundles() + "/" + kAttacker);
  });
}

// The honest half of both: nothing happens to whoever is still what it was.
TEST_F(Outlived, AProcessWhoseBundleStaysKeepsItsConnectionWhateverIsInstalledBesideIt) {
  Accomplice early(house_, {"connect", kDVServiceName});
  Client connection(early.connection());
  ctl({"uninstall", kVictim});
  eventually("the other one is gone", [this] { return house_.confined(kVictim, {}).status == 127; });
  fs::remove_all(house_.bundles() + "/" + kTrickster);
  eventually("that is known", [this] { return house_.ctl({"bookmark", house_.storage(kTrickster) + "/x"}).status != 0; });
  EXPECT_EQ(whoIsAt(connection), kIsAttacker);
  EXPECT_EQ(attack(whoAmI()), kIsAttacker);
}

}  // namespace
}  // namespace docuvend::tests
