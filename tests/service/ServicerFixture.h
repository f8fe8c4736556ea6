// One servicer of one client, the shared store behind its server, and two providers, "com.orvane.cellar" and "com.orvane.attic", that are
// registered and whose extensions answer what a test tells them to.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "common/DVErrors.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVRpcServicer.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {

class StoreSource final : public DVAccessControlSource {
 public:
  [[nodiscard]] std::shared_ptr<DVAccessControlStore> accessControlStore() const override { return store.lock(); }

  std::weak_ptr<DVAccessControlStore> store;
};

// What a reply handler was given, on which queue, and how many lines this room had logged by then.
struct Answer {
  std::optional<QXError> error = std::nullopt;
  std::optional<QXData> itemToken = std::nullopt;
  std::optional<QXURL> siblingURL = std::nullopt;
  std::optional<QXData> siblingToken = std::nullopt;
  std::optional<QXDictionary> providers = std::nullopt;
  std::optional<std::string> string = std::nullopt;
  std::optional<QXURL> url = std::nullopt;
  std::string queue = {};
  std::size_t linesBefore = 0;

  [[nodiscard]] bool hasNoValue() const { return !itemToken && !siblingURL && !siblingToken && !providers && !string && !url; }
};

class ServicerFixture : public testing::Test {
 protected:
  using Entries = std::vector<fake_platform::FakeLogEntry>;

  static constexpr int kPid = 4711;
  static constexpr const char* kAccessControlFile = "/home/fake/Library/Docuvend/AccessControl.plist";

  ServicerFixture() {
    source_->store = DVAccessControlStore::sharedStore();
    connection_->setProcessIdentifier(kPid);
    connection_->setAuditToken(token_);
    platform_.applicationRegistry.setBundleIdentifier(token_, kEditor.value);
    servicer_ = std::make_shared<DVRpcServicer>(source_, connection_);
    platform_.log.onWrite([this](const auto&) { submittedAtLastLine_ = platform_.queues.pendingOnGlobalQueue(); });
  }

  // Has both providers discovered and registered. What was logged and asked until then is forgotten.
  void registerProviders() {
    DVExtensionDocuvend::createInstancesCompletion(/*completion=*/{});
    platform_.extensionHost.setExtensions({cellar_, attic_});
    platform_.queues.runAll();
    ASSERT_NE(DVExtensionDocuvend::providerWithIdentifier(kCellar), nullptr);
    ASSERT_NE(DVExtensionDocuvend::providerWithIdentifier(kAttic), nullptr);
    platform_.log.clear();
  }

  // One is updated: its registered object is another from then on. Its extension answers nothing but its setup.
  std::shared_ptr<fake_platform::FakeExtension> updateCellar() {
    auto updated = platform_.installProvider(kCellar.value, /*version=*/2);
    platform_.extensionHost.setExtensions({updated, attic_});
    platform_.queues.runAll();
    return updated;
  }
  // One is uninstalled.
  void removeCellar() {
    platform_.extensionHost.setExtensions({attic_});
    platform_.queues.runAll();
    ASSERT_EQ(DVExtensionDocuvend::providerWithIdentifier(kCellar), nullptr);
  }
  // Has the object that is registered under the one identifier say that it has the other.
  static void rename(const ProviderID& registered, const ProviderID& own) {
    DVExtensionDocuvend::providerWithIdentifier(registered)->setIdentifier(own);
  }
  // Has the object that is registered under the identifier say that it has none. Gives the extension that it has from then on.
  std::shared_ptr<fake_platform::FakeExtension> loseIdentifier(const ProviderID& registered) {
    auto nameless = std::make_shared<fake_platform::FakeExtension>(std::nullopt);
    platform_.adopt(*nameless);
    const auto provider = DVExtensionDocuvend::providerWithIdentifier(registered);
    provider->setExtension(nameless);
    provider->setIdentifier(std::nullopt);
    EXPECT_EQ(provider->identifier(), std::nullopt);
    return nameless;
  }
  // A store of the server's own, which is not the shared one.
  std::shared_ptr<DVAccessControlStore> giveServerItsOwnStore() {
    auto own = std::make_shared<DVAccessControlStore>();
    source_->store = own;
    return own;
  }

  void entitle(std::string_view entitlement) { connection_->setEntitlement(std::string(entitlement), true); }
  void letConnectionGo() { connection_.reset(); }

  static DVAccessControlStore& store() { return *DVAccessControlStore::sharedStore(); }
  static void grant(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer) {
    store().allowProviderWithIdentifier(provider, item, consumer);
  }

  static void answerItemID(fake_platform::FakeExtension& extension, std::optional<QXError> error, std::optional<std::string> item) {
    extension.vendor().respond("_identifierForItemAtURL:completion:", [error, item](const QXArray&) {
      return QXArray{error ? QXValue(*error) : QXValue(), item ? QXValue(*item) : QXValue()};
    });
  }
  static void answerURL(fake_platform::FakeExtension& extension, std::optional<QXError> error, std::optional<QXURL> url) {
    extension.vendor().respond("_URLForItemIdentifier:completion:", [error, url](const QXArray&) {
      return QXArray{error ? QXValue(*error) : QXValue(), url ? QXValue(*url) : QXValue()};
    });
  }

  // What this room logged: the lines of the providers' room and of the store are theirs to test.
  [[nodiscard]] Entries logged() const {
    Entries entries = platform_.log.entries();
    std::erase_if(entries, [](const auto& entry) {
      return entry.text.find(kInLinesOfForwardedOperations) != std::string::npos ||
             std::ranges::any_of(kLinesOfOtherRooms, [&entry](std::string_view start) { return entry.text.starts_with(start); });
    });
    return entries;
  }

  // A handler for each kind of reply, which notes what it is given.
  DVDaemon::ErrorReply errorReply() {
    return [this](std::optional<QXError> error) { note({.error = std::move(error)}); };
  }
  DVDaemon::SandboxReply sandboxReply() {
    return [this](std::optional<QXError> error, std::optional<QXData> itemToken, std::optional<QXURL> siblingURL,
                  std::optional<QXData> siblingToken) {
      note({.error = std::move(error),
            .itemToken = std::move(itemToken),
            .siblingURL = std::move(siblingURL),
            .siblingToken = std::move(siblingToken)});
    };
  }
  DVDaemon::ProvidersReply providersReply() {
    return [this](std::optional<QXError> error, std::optional<QXDictionary> providers) {
      note({.error = std::move(error), .providers = std::move(providers)});
    };
  }
  DVDaemon::StringReply stringReply() {
    return [this](std::optional<std::string> string, std::optional<QXError> error) {
      note({.error = std::move(error), .string = std::move(string)});
    };
  }
  DVDaemon::DocumentReply documentReply() {
    return [this](std::optional<QXURL> url, std::optional<QXData> itemToken, std::optional<QXURL> siblingURL,
                  std::optional<QXData> siblingToken, std::optional<QXError> error) {
      note({.error = std::move(error),
            .itemToken = std::move(itemToken),
            .siblingURL = std::move(siblingURL),
            .siblingToken = std::move(siblingToken),
            .url = std::move(url)});
    };
  }

  // The one answer: it was not there when the operation returned, and a task of the global queue brings it.
  const Answer& earlyAnswer() {
    EXPECT_TRUE(answers_.empty());
    EXPECT_EQ(platform_.queues.pendingOnGlobalQueue(), 1U);
    EXPECT_EQ(submittedAtLastLine_, 0U) << "what the operation logs is logged before the task is submitted";
    platform_.queues.runAll();
    EXPECT_EQ(answers_.size(), 1U);
    if (answers_.empty()) answers_.emplace_back();
    EXPECT_EQ(answers_.front().queue, fake_platform::kFakeGlobalQueueLabel);
    EXPECT_EQ(answers_.front().linesBefore, logged().size()) << "what is logged is logged before the answer";
    return answers_.front();
  }
  // The one answer: the extension's own brought it.
  const Answer& lateAnswer() {
    EXPECT_EQ(answers_.size(), 1U);
    if (answers_.empty()) answers_.emplace_back();
    EXPECT_EQ(answers_.front().queue, "");
    EXPECT_EQ(platform_.queues.pending(), 0U);
    EXPECT_EQ(answers_.front().linesBefore, logged().size()) << "what is logged is logged before the answer";
    return answers_.front();
  }

  const ProviderID kCellar{"com.orvane.cellar"};
  const ProviderID kAttic{"com.orvane.attic"};
  const ProviderID kNobody{"com.orvane.nobody"};
  const ConsumerID kEditor{"com.example.editor"};
  const ConsumerID kStranger{"com.example.stranger"};
  const ItemID kItem{"item 7"};
  const QXError kExtensionError = QXError::make("CellarErrorDomain", 5, "the cellar is flooded");
  const QXURL kReport = fake_platform::FakePlatform::itemURL("com.orvane.cellar", "report.txt");
  const std::string kReportPath = fake_platform::FakePlatform::storagePath("com.orvane.cellar") + "/report.txt";
  const std::string kSiblingPath = fake_platform::FakePlatform::storagePath("com.orvane.cellar") + "/.report.txt";
  const QXURL kSibling = fake_platform::FakePlatform::itemURL("com.orvane.cellar", ".report.txt");
  const QXURL kElsewhere = QXURL::fileURL("/tmp/elsewhere.txt", QXURLKind::file);

  fake_platform::FakePlatform platform_;
  std::shared_ptr<fake_platform::FakeExtension> cellar_ = platform_.installProvider("com.orvane.cellar");
  std::shared_ptr<fake_platform::FakeExtension> attic_ = platform_.installProvider("com.orvane.attic");
  const QXAuditToken token_ = fake_platform::FakeApplicationRegistry::token(1);
  std::shared_ptr<StoreSource> source_ = std::make_shared<StoreSource>();
  std::shared_ptr<fake_platform::FakeRpcConnection> connection_ = fake_platform::FakeRpcConnection::create();
  std::shared_ptr<DVRpcServicer> servicer_;
  std::vector<Answer> answers_;
  std::size_t submittedAtLastLine_ = 0;  // tasks that waited on the global queue when the latest line was logged

 private:
  static constexpr std::string_view kInLinesOfForwardedOperations = " for extension com.orvane.";
  static constexpr std::string_view kLinesOfOtherRooms[] = {
      "[DEBUG] -[DVExtensionDocuvend ",       "[DEBUG] Beginning extension request.",
      "[INFO] Resolved URL to provider ",     "[DEBUG] Ignoring URLs that exactly match",
      "[DEBUG] Successfully got item ID ",    "[DEBUG] Successfully retrieved URL ",
      "[ERROR] Extension request failed.",    "[ERROR] Error getting remote proxy object",
      "[INFO] Allowing provider ID ",         "[INFO] Provider ID ",
      "[INFO] Committing access control list"};

  void note(Answer answer) {
    answer.queue = platform_.queues.currentLabel();
    answer.linesBefore = logged().size();
    answers_.push_back(std::move(answer));
  }
};

}  // namespace docuvend
