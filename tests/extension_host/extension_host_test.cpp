// What every extension host does, in memory and with real processes.
#include "platform/extension_host.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "platform/fake/FakeExtensionHost.h"
#include "tests/extension_host/support/RealExtensions.h"

namespace docuvend {
namespace {

using linux_platform::begin;
using linux_platform::Conversation;
using linux_platform::Reports;

constexpr const char* kFirst = "com.orvane.first";
constexpr const char* kSecond = "com.orvane.second";

// Extensions are given as identifier and version.
using Installed = std::vector<std::pair<std::string, int>>;

class FakeHarness {
 public:
  [[nodiscard]] static bool mayRun() { return true; }

  std::unique_ptr<QXExtensionMatch> match(const Installed& present, Reports& reports) {
    set(present);
    auto match = host_.beginMatching({{std::string(kQXExtensionPointName), linux_platform::kPoint}}, {hostInterface_, vendorInterface_},
                                     [&reports](Reports::Set set, const std::optional<QXError>&) { reports.add(std::move(set)); });
    host_.deliver();
    return match;
  }

  void set(const Installed& present) {
    std::vector<std::shared_ptr<QXExtension>> extensions;
    for (const auto& [identifier, version] : present) {
      auto extension = std::make_shared<fake_platform::FakeExtension>(identifier, version);
      extension->vendor().respond("_URLForItemIdentifier:completion:", [](const QXArray&) {
        return QXArray{QXValue(), QXURL::fileURL("/item", QXURLKind::file)};
      });
      extensions.push_back(std::move(extension));
    }
    host_.setExtensions(std::move(extensions));
  }

  void stop() {}

 private:
  QXRpcInterface hostInterface_ = qxInterfaceOf<_QXDocuvendHostProtocol>();
  QXRpcInterface vendorInterface_ = qxInterfaceOf<_QXDocuvendVendor>();
  fake_platform::FakeExtensionHost host_;
};

class LinuxHarness {
 public:
  [[nodiscard]] static bool mayRun() { return linux_platform::RealExtensions::mayRun(); }

  std::unique_ptr<QXExtensionMatch> match(const Installed& present, Reports& reports) {
    set(present);
    return real_.match(reports);
  }

  void set(const Installed& present) {
    std::vector<linux_platform::Bundle> bundles;
    for (const auto& [identifier, version] : present) {
      bundles.push_back(real_.makeBundle(identifier));
      bundles.back().version = std::to_string(version);
    }
    real_.install(std::move(bundles));
  }

  void stop() { real_.dropHost(); }

 private:
  linux_platform::RealExtensions real_;
};

template <class Harness>
class ExtensionHostSuite : public ::testing::Test {
 protected:
  void SetUp() override {
    if (!Harness::mayRun()) GTEST_FAIL();
  }

  std::shared_ptr<QXExtension> one() {
    match_ = harness.match({{kFirst, 1}}, reports);
    const auto set = reports.await(0);
    return set && set->size() == 1 ? set->front() : nullptr;
  }

  void TearDown() override {
    match_.reset();
    harness.stop();
  }

  Harness harness;
  Reports reports;  // holds extensions, which must not outlive what they work with
  std::unique_ptr<QXExtensionMatch> match_;
};

struct HarnessNames {
  template <class Harness>
  static std::string GetName(int) {
    return std::is_same_v<Harness, FakeHarness> ? "Fake" : "Linux";
  }
};

using Harnesses = ::testing::Types<FakeHarness, LinuxHarness>;
TYPED_TEST_SUITE(ExtensionHostSuite, Harnesses, HarnessNames);

TYPED_TEST(ExtensionHostSuite, AMatchReportsThePresentSetEvenIfItIsEmpty) {
  this->match_ = this->harness.match({}, this->reports);
  const auto set = this->reports.await(0);
  ASSERT_TRUE(set);
  EXPECT_TRUE(set->empty());
}

TYPED_TEST(ExtensionHostSuite, EachChangeIsReportedWithTheWholeSet) {
  this->match_ = this->harness.match({{kFirst, 1}}, this->reports);
  ASSERT_TRUE(this->reports.await(0));
  this->harness.set({{kFirst, 1}, {kSecond, 1}});
  const auto both = this->reports.await(1);
  ASSERT_TRUE(both);
  ASSERT_EQ(both->size(), 2U);
  EXPECT_EQ((*both)[0]->identifier(), kFirst);
  EXPECT_EQ((*both)[1]->identifier(), kSecond);
  this->harness.set({});
  const auto none = this->reports.await(2);
  ASSERT_TRUE(none);
  EXPECT_TRUE(none->empty());
}

TYPED_TEST(ExtensionHostSuite, AnUnchangedExtensionEqualsItselfAndAnUpdatedOneIsAnother) {
  this->match_ = this->harness.match({{kFirst, 1}, {kSecond, 1}}, this->reports);
  const auto before = this->reports.await(0);
  this->harness.set({{kFirst, 2}, {kSecond, 1}});
  const auto after = this->reports.await(1);
  ASSERT_TRUE(before && after);
  ASSERT_EQ(after->size(), 2U);
  EXPECT_EQ((*after)[0]->identifier(), kFirst);
  EXPECT_FALSE((*after)[0]->isEqual(*(*before)[0]));
  EXPECT_TRUE((*after)[1]->isEqual(*(*before)[1]));
  EXPECT_FALSE((*after)[0]->isEqual(*(*after)[1]));
}

TYPED_TEST(ExtensionHostSuite, AnExtensionsDescriptionNamesIt) {
  const auto extension = this->one();
  ASSERT_TRUE(extension);
  EXPECT_NE(extension->description().find(kFirst), std::string::npos);
}

TYPED_TEST(ExtensionHostSuite, ARequestHasAnIdentifierOfItsOwnAndAContext) {
  const auto extension = this->one();
  ASSERT_TRUE(extension);
  const Conversation first(extension);
  const Conversation second(extension);
  EXPECT_FALSE(first.error());
  EXPECT_FALSE(second.error());
  EXPECT_NE(first.request(), second.request());
}

TYPED_TEST(ExtensionHostSuite, AMessageIsAnswered) {
  const auto extension = this->one();
  ASSERT_TRUE(extension);
  const Conversation conversation(extension);
  const auto answer = linux_platform::await(conversation.locate("item"));
  ASSERT_TRUE(answer);
  ASSERT_FALSE(answer->error) << answer->error->description();
  ASSERT_EQ(answer->values.size(), 2U);
  EXPECT_TRUE(answer->values[0].isAbsent());
  EXPECT_NE(answer->values[1].as<QXURL>(), nullptr);
}

TYPED_TEST(ExtensionHostSuite, ACancelledRequestHasNoContextAndTheOthersHave) {
  const auto extension = this->one();
  ASSERT_TRUE(extension);
  const auto first = begin(*extension);
  const auto second = begin(*extension);
  ASSERT_TRUE(first && first->request && second && second->request);
  extension->cancelExtensionRequest(*first->request);
  EXPECT_EQ(extension->extensionContextForRequest(*first->request), nullptr);
  EXPECT_NE(extension->extensionContextForRequest(*second->request), nullptr);
}

TYPED_TEST(ExtensionHostSuite, AnUnknownRequestHasNoContextAndIsCancelledWithoutHarm) {
  const auto extension = this->one();
  ASSERT_TRUE(extension);
  const Conversation conversation(extension);
  QXUUID unknown;
  unknown.bytes.fill(0xFF);
  EXPECT_EQ(extension->extensionContextForRequest(unknown), nullptr);
  extension->cancelExtensionRequest(unknown);
  EXPECT_NE(extension->extensionContextForRequest(conversation.request()), nullptr);
}

}  // namespace
}  // namespace docuvend
