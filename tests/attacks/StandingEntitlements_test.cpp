// To gain an entitlement, or what only an entitlement gives: a change of the list of grants.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "tests/attacks/TwoApplications.h"
#include "tests/attacks/told.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::_;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

const std::string kRead = "com.orvane.docuvend.acl-read";
const std::string kWrite = "com.orvane.docuvend.acl-write";
const std::string kLacks = "DVErrorDomain 1";
const std::string kRefused = "DVErrorDomain 2";

std::string entry(const std::string& name, const std::string& value) { return "<key>" + name + "</key>" + value; }

class EntitlementAttacks : public TwoApplications {
 protected:
  // One more bundle of the attacker's program.
  void installWith(const std::string& bundle, const std::string& entitlements) const {
    const std::string place = house_.bundles() + "/." + bundle;
    fs::create_directory(place);
    fs::create_hard_link(sameProgram(), place + "/program");
    writeFile(place + "/Info.plist",
              propertyList(stringEntry("QXBundleExecutable", "program") + stringEntry("QXBundleIdentifier", bundle)));
    writeFile(place + "/Entitlements.plist", propertyList(entitlements));
    fs::rename(place, house_.bundles() + "/" + bundle);
  }
  void entitleAttackerTo(const std::string& entitlements) const {
    const std::string place = house_.bundles() + "/" + kAttacker + "/Entitlements.plist";
    writeFile(place + ".new", propertyList(entitlements));
    fs::rename(place + ".new", place);
  }
  // To have the victim's document granted to a bundle.
  [[nodiscard]] Lines grantTo(const std::string& consumer) const { return {"grant", othersPath_, kCellar, consumer}; }
  [[nodiscard]] std::string grantOver(Client& connection) const {
    return told(errorOf(connection.ask<&DVDaemon::extendSandboxForFileURL>(url(othersPath_), ProviderID{kCellar}, ConsumerID{kAttacker})));
  }
  void awaitBundles(const std::vector<std::string>& bundles) const {
    eventually("the bundles are known", [this, &bundles] {
      for (const auto& bundle : bundles) {
        if (told(errorOf(house_.client(bundle)->ask<&DVDaemon::wakeUpCompletion>())) != "ok") return false;
      }
      return true;
    });
  }
};

TEST_F(EntitlementAttacks, AnEntitlementThatIsNoTrueNumberDoesNotCount) {
  const std::vector<std::pair<std::string, std::string>> values = {{"string", "<string>true</string>"},
                                                                   {"array", "<array><true/></array>"},
                                                                   {"dictionary", "<dict><key>value</key><true/></dict>"},
                                                                   {"data", "<data>AQ==</data>"},
                                                                   {"false", "<false/>"},
                                                                   {"zero", "<integer>0</integer>"},
                                                                   {"true", "<true/>"},
                                                                   {"one", "<integer>1</integer>"}};
  std::vector<std::string> bundles;
  for (const auto& [name, value] : values) {
    bundles.push_back("com.example.v-" + name);
    installWith(bundles.back(), entry(kWrite, value) + entry(kRead, value));
  }
  awaitBundles(bundles);
  const std::string before = house_.accessControl();
  for (std::size_t i = 0; i < values.size(); ++i) {
    const bool counts = values[i].first == "true" || values[i].first == "one";
    if (!counts) {
      EXPECT_EQ(house_.accessControl(), before);
    }
    EXPECT_EQ(as(bundles[i], joined(grantTo(bundles[i]), {"providers"})), (counts ? Lines{"ok", "ok"} : Lines{kLacks, kLacks}))
        << values[i].first;
  }
  EXPECT_THAT(house_.accessControl(), HasSubstr("com.example.v-true"));
  EXPECT_THAT(house_.accessControl(), HasSubstr("com.example.v-one"));
}

TEST_F(EntitlementAttacks, AnEntitlementWrittenAfterConnectingIsOfUseToLaterConnectionsAlone) {
  Accomplice early(house_, {"connect", kDVServiceName});
  Client connection(early.connection());
  EXPECT_EQ(grantOver(connection), kLacks);
  entitleAttackerTo(trueEntry(kWrite));
  eventually("the entitlement is known", [this] { return attack(grantTo(kAttacker)) == Lines{"ok"}; });
  EXPECT_EQ(grantOver(connection), kLacks);
}

TEST_F(EntitlementAttacks, AnEntitlementTakenAwayAfterConnectingHoldsUntilThatConnectionEnds) {
  entitleAttackerTo(trueEntry(kWrite));
  eventually("the entitlement is known", [this] { return attack({"providers"}) == Lines{"ok"}; });
  Accomplice early(house_, {"connect", kDVServiceName});
  Client connection(early.connection());
  EXPECT_EQ(grantOver(connection), "ok");
  entitleAttackerTo({});
  eventually("the entitlement is gone", [this] { return attack({"providers"}) == Lines{kLacks}; });
  EXPECT_EQ(grantOver(connection), "ok");
  EXPECT_EQ(attack(grantTo(kAttacker)), Lines{kLacks});
}

TEST_F(EntitlementAttacks, AConfinedProcessCannotWriteEntitlements) {
  const std::string own = house_.bundles() + "/" + kAttacker + "/Entitlements.plist";
  const std::string another = house_.bundles() + "/com.example.mine";
  const std::string inside = house_.container(kAttacker) + "/Entitlements.plist";
  const std::string list = propertyList(trueEntry(kWrite));
  // Where the home lies below /tmp, the second one is in a directory of the confinement's own.
  EXPECT_THAT(attack(joined({"put", own, list, "put", another, list, "put", inside, list}, grantTo(kAttacker))),
              ElementsAre("EROFS", _, "ok", kLacks));
  EXPECT_FALSE(fs::exists(another));
  EXPECT_EQ(contentsOf(own), propertyList({}));
}

TEST_F(EntitlementAttacks, WhoMayReadTheListChangesNothingInItButMayNameOthers) {
  installWith("com.example.reader", trueEntry(kRead));
  awaitBundles({"com.example.reader"});
  const std::string before = house_.accessControl();
  EXPECT_EQ(as("com.example.reader", joined(grantTo("com.example.reader"), {"provide", othersPath_, kCellar, "com.example.reader"})),
            (Lines{kLacks, kRefused}));
  EXPECT_EQ(house_.accessControl(), before);
  EXPECT_EQ(as("com.example.reader", {"provide", othersPath_, kCellar, kVictim}), Lines{"ok"});
  EXPECT_EQ(attack({"provide", othersPath_, kCellar, kVictim}), Lines{kLacks});
}

TEST_F(EntitlementAttacks, WhoMayWriteTheListMayNameAnyConsumer) {
  EXPECT_EQ(attack(joined(grantTo(kAttacker), whoAmI())), joined({kLacks}, kIsAttacker));
  installWith("com.example.writer", trueEntry(kWrite));
  awaitBundles({"com.example.writer"});
  EXPECT_EQ(as("com.example.writer", grantTo(kAttacker)), Lines{"ok"});
  EXPECT_EQ(attack(whoAmI()), (Lines{"ok", "ok"}));
}

TEST_F(EntitlementAttacks, WithoutTheEntitlementOnlyADocumentThatOneMayWriteIsPassedOn) {
  const std::string before = house_.accessControl();
  const Lines others = {"pass-on", othersPath_, kAttacker};
  const Lines own = {"pass-on", ownPath_, kVictim};
  EXPECT_EQ(attack(joined(joined(others, own), {"ask", own_})), (Lines{kRefused, kRefused, "ok"}));
  EXPECT_EQ(attack(joined(joined({"redeem-for", "reading", own_}, others), own)), (Lines{"ok", kRefused, kRefused}));
  EXPECT_EQ(attack({"redeem-for", "writing", others_}), Lines{kRefused});
  EXPECT_EQ(house_.accessControl(), before);
  EXPECT_EQ(attack(joined(joined({"redeem-for", "writing", own_}, others), own)), (Lines{"ok", kRefused, "ok"}));
  EXPECT_EQ(as(kVictim, whoAmI()), (Lines{"ok", "ok"}));
  EXPECT_EQ(attack(whoAmI()), kIsAttacker);
}

}  // namespace
}  // namespace docuvend::tests
