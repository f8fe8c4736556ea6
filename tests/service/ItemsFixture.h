// The three item operations as rows: what they have in common is tested over all of them, what differs by name.
#pragma once

#include <algorithm>
#include <optional>
#include <ostream>
#include <string>
#include <utility>

#include "tests/service/ServicerFixture.h"

namespace docuvend {

struct ItemOperation {
  const char* title;
  void (DVRpcServicer::*ask)(std::optional<QXURL> url, std::optional<ProviderID> provider, std::optional<ConsumerID> consumer,
                             DVDaemon::ErrorReply reply);
  const char* serving;
  const char* message;  // to the extension
  // What the extension answers to it.
  QXArray (*answer)(std::optional<QXError> error);
  // What the line of a request that never reaches its provider begins with, and what the client is told of its error.
  const char* refusal;
  QXError (*refused)(const QXError& error);

  friend void PrintTo(const ItemOperation& operation, std::ostream* out) { *out << operation.title; }
};

inline QXValue errorOrNothing(const std::optional<QXError>& error) { return error ? QXValue(*error) : QXValue(); }

inline constexpr ItemOperation kPlaceholder{
    "Placeholder",
    &DVRpcServicer::providePlaceholderForItemAtURL,
    "[DEBUG] Serving: providePlaceholderForItemAtURL:fromProviderID:forConsumerID:completionHandler:",
    "_providePlaceholderAtURL:completion:",
    [](std::optional<QXError> error) {
      return QXArray{QXValue(), errorOrNothing(error)};
    },
    "[ERROR] Could not provide placeholder for ",
    [](const QXError& error) { return error; },
};

inline constexpr ItemOperation kStart{
    "Start",
    &DVRpcServicer::startProvidingItemAtURL,
    "[DEBUG] Serving: startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:",
    "_startProvidingItemAtURL:completion:",
    [](std::optional<QXError> error) { return QXArray{errorOrNothing(error)}; },
    "[ERROR] Cannot provide item at ",
    [](const QXError& error) { return DVNotFoundError(error); },
};

inline constexpr ItemOperation kStop{
    "Stop",
    &DVRpcServicer::stopProvidingItemAtURL,
    "[DEBUG] Serving: stopProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:",
    "_stopProvidingItemAtURL:completion:",
    [](std::optional<QXError> error) { return QXArray{errorOrNothing(error)}; },
    "[ERROR] Could not stop providing item at ",
    [](const QXError& error) { return DVNotFoundError(error); },
};

inline constexpr const char* kIdentifierMessage = "_identifierForItemAtURL:completion:";

// The client may read, and the cellar knows the item and does what it is asked for.
class ItemsFixture : public ServicerFixture {
 protected:
  explicit ItemsFixture(const ItemOperation& operation) : operation_(operation) {}

  void SetUp() override {
    registerProviders();
    entitle(kDVReadEntitlement);
    answerItemID(*cellar_, /*error=*/std::nullopt, kItem.value);
    answerOperation(/*error=*/std::nullopt);
  }

  void answerOperation(std::optional<QXError> error) {
    cellar_->vendor().respond(operation_.message, [this, error](const QXArray&) { return operation_.answer(error); });
  }
  // The message waits until the test answers it.
  void hold(const char* message) {
    cellar_->vendor().respond(message, [](const QXArray&) { return std::nullopt; });
  }

  void ask(std::optional<QXURL> url, std::optional<ProviderID> provider, std::optional<ConsumerID> consumer) {
    askFor(std::move(url), std::move(provider), std::move(consumer), errorReply());
  }
  void askWithoutReply(const QXURL& url) { askFor(url, kCellar, kEditor, /*reply=*/{}); }
  // As the granted consumer of the report. What granting logged is forgotten.
  void grantAndAsk() {
    grant(kCellar, kItem, kEditor);
    platform_.log.clear();
    ask(kReport, kCellar, kEditor);
  }

  // What the cellar was asked since it was registered.
  [[nodiscard]] std::vector<std::string> asked() const {
    auto names = cellar_->vendor().operationNames();
    names.erase(names.begin());  // its initial setup
    return names;
  }
  [[nodiscard]] bool wasForwarded() const {
    const auto names = asked();
    return std::ranges::find(names, operation_.message) != names.end();
  }

  // The lines of a request that never reached its provider.
  [[nodiscard]] Entries refusalLines(const std::string& request, const QXError& error) const {
    return {{QXLogType::debug, operation_.serving}, {QXLogType::fault, operation_.refusal + request + ". Error: " + error.description()}};
  }
  [[nodiscard]] std::string requestText(const QXURL& url, const ProviderID& provider) const {
    return "URL " + url.absoluteString() + " from provider ID " + provider.value + " to consumer ID " + kEditor.value;
  }

  void askFor(std::optional<QXURL> url, std::optional<ProviderID> provider, std::optional<ConsumerID> consumer,
              DVDaemon::ErrorReply reply) {
    (servicer_.get()->*operation_.ask)(std::move(url), std::move(provider), std::move(consumer), std::move(reply));
  }

  const ItemOperation& operation_;
};

// Over the rows that a suite is instantiated with.
class ItemsFixtureOverRows : public ItemsFixture, public testing::WithParamInterface<ItemOperation> {
 protected:
  ItemsFixtureOverRows() : ItemsFixture(GetParam()) {}
};

inline std::string titleOf(const testing::TestParamInfo<ItemOperation>& row) { return row.param.title; }

}  // namespace docuvend
