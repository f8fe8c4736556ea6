// One behaviour of the application registry, over the fake and over real bundles and processes.
#include "platform/linux/identity/LinuxApplicationRegistry.h"

#include <gtest/gtest.h>
#include <signal.h>

#include <type_traits>

#include "platform/fake/FakeApplicationRegistry.h"
#include "tests/launch/PeerTest.h"

namespace docuvend::linux_platform {
namespace {

// Bundles and a caller in memory.
class FakeRegistryHouse : public ::testing::Test {
 protected:
  void installProvider(const std::string& identifier, const std::string& group) {
    registry_.setProviderRecord(identifier, group, "/groups/" + group);
  }
  void installPlain(const std::string& identifier) {
    registry_.setRecord(identifier, {{"QXBundleIdentifier", identifier}, {"QXExtension", "text"}}, {});
  }
  QXAuditToken connectAs(const std::string& identifier) {
    registry_.setBundleIdentifier(fake_platform::FakeApplicationRegistry::token(1), identifier);
    return fake_platform::FakeApplicationRegistry::token(1);
  }
  QXAuditToken connectAsNoBundle() { return fake_platform::FakeApplicationRegistry::token(2); }
  void endCaller() { registry_.removeBundleIdentifier(fake_platform::FakeApplicationRegistry::token(1)); }
  void uninstall(const std::string& identifier) { registry_.removeRecord(identifier); }
  [[nodiscard]] std::string groupContainer(const std::string& group) const { return "/groups/" + group; }
  [[nodiscard]] QXApplicationRegistry& registry() { return registry_; }

  fake_platform::FakeApplicationRegistry registry_;
};

// Bundles on disk, and a confined process.
class LinuxRegistryHouse : public PeerTest {
 protected:
  void installProvider(const std::string& identifier, const std::string& group) {
    (void)house_.installProbe(identifier, BundleHouse::entry("QXGroups", BundleHouse::array({group})) +
                                              BundleHouse::entry("QXExtension",
                                                                 "<dict><key>QXExtensionPointName</key><string>com.orvane.docuvend-nonui"
                                                                 "</string></dict>"));
    bundles_.bundles = house_.scan();
  }
  void installPlain(const std::string& identifier) {
    (void)house_.installProbe(identifier, BundleHouse::entry("QXExtension", BundleHouse::text("text")));
    bundles_.bundles = house_.scan();
  }
  QXAuditToken connectAs(const std::string& identifier) {
    caller_.emplace(confined(bundles_.bundles.at(identifier)));
    identity_ = peers_.identify(caller_->connection.get());
    return identity_->token;
  }
  QXAuditToken connectAsNoBundle() {
    outsider_.emplace(unconfined());
    outsiderIdentity_ = peers_.identify(outsider_->connection.get());
    return outsiderIdentity_->token;
  }
  // The process ends; its connection is still there.
  void endCaller() {
    ASSERT_EQ(::kill(identity_->pid, SIGKILL), 0);
    EXPECT_NE(caller_->process.status(), 0);
  }
  void uninstall(const std::string& identifier) { bundles_.bundles.erase(identifier); }
  [[nodiscard]] std::string groupContainer(const std::string& group) const { return house_.paths.groupContainers + "/" + group; }
  [[nodiscard]] QXApplicationRegistry& registry() { return registry_; }

  LinuxPeerDirectory peers_{bundles_, house_.log.defaultLog()};
  LinuxApplicationRegistry registry_{bundles_, peers_};
  std::optional<Peer> caller_;
  std::optional<Peer> outsider_;
  std::shared_ptr<const PeerIdentity> identity_;
  std::shared_ptr<const PeerIdentity> outsiderIdentity_;
};

template <class House>
class ApplicationRegistryBehaviour : public House {};
using Houses = ::testing::Types<FakeRegistryHouse, LinuxRegistryHouse>;
TYPED_TEST_SUITE(ApplicationRegistryBehaviour, Houses);

TYPED_TEST(ApplicationRegistryBehaviour, ThereIsNoRecordOfWhatIsNotInstalled) {
  EXPECT_FALSE(this->registry().recordForIdentifier("org.a"));
  this->installPlain("org.a");
  EXPECT_TRUE(this->registry().recordForIdentifier("org.a"));
  this->uninstall("org.a");
  EXPECT_FALSE(this->registry().recordForIdentifier("org.a"));
}

TYPED_TEST(ApplicationRegistryBehaviour, ARecordGivesDictionariesOfInfoPlist) {
  this->installProvider("org.a", "org.a.docs");
  const auto record = this->registry().recordForIdentifier("org.a");
  ASSERT_TRUE(record);
  const auto* extension = record->infoDictionaryForKey("QXExtension");
  ASSERT_NE(extension, nullptr);
  EXPECT_NE(qxFind<std::string>(*extension, "QXExtensionPointName"), nullptr);
  EXPECT_EQ(record->infoDictionaryForKey("QXBundleIdentifier"), nullptr);
  EXPECT_EQ(record->infoDictionaryForKey("missing"), nullptr);
  this->installPlain("org.b");
  EXPECT_EQ(this->registry().recordForIdentifier("org.b")->infoDictionaryForKey("QXExtension"), nullptr);
}

TYPED_TEST(ApplicationRegistryBehaviour, ARecordGivesTheContainersOfItsGroups) {
  this->installProvider("org.a", "org.a.docs");
  const auto containers = this->registry().recordForIdentifier("org.a")->groupContainers();
  ASSERT_EQ(containers.size(), 1U);
  EXPECT_EQ(containers.at("org.a.docs"), QXURL::fileURL(this->groupContainer("org.a.docs"), QXURLKind::directory));
  this->installPlain("org.b");
  EXPECT_TRUE(this->registry().recordForIdentifier("org.b")->groupContainers().empty());
}

TYPED_TEST(ApplicationRegistryBehaviour, ACallerHasTheIdentifierOfItsBundle) {
  this->installPlain("org.a");
  const auto token = this->connectAs("org.a");
  EXPECT_EQ(this->registry().bundleIdentifierForAuditToken(token), "org.a");
}

TYPED_TEST(ApplicationRegistryBehaviour, ACallerThatIsGoneHasNone) {
  this->installPlain("org.a");
  const auto token = this->connectAs("org.a");
  this->endCaller();
  EXPECT_FALSE(this->registry().bundleIdentifierForAuditToken(token));
}

TYPED_TEST(ApplicationRegistryBehaviour, WhoBelongsToNoBundleHasNone) {
  EXPECT_FALSE(this->registry().bundleIdentifierForAuditToken(QXAuditToken{}));
  EXPECT_FALSE(this->registry().bundleIdentifierForAuditToken(this->connectAsNoBundle()));
}

TEST_F(LinuxRegistryHouse, CreatesNoContainers) {
  installProvider("org.a", "org.a.docs");
  ASSERT_TRUE(registry().recordForIdentifier("org.a"));
  EXPECT_FALSE(std::filesystem::exists(house_.paths.groupContainers));
  EXPECT_FALSE(std::filesystem::exists(house_.paths.containers));
}

TEST_F(LinuxRegistryHouse, ACallerThatDeclaredABundleHasItsIdentifier) {
  installPlain("org.a");
  const auto token = connectAsNoBundle();
  const auto declared = peers_.declare(*outsiderIdentity_, "org.a");
  ASSERT_TRUE(declared);
  EXPECT_EQ(registry().bundleIdentifierForAuditToken(token), "org.a");
}

}  // namespace
}  // namespace docuvend::linux_platform
