// The consumer library: what an application asks of Docuvend, as plain calls.
//
//   auto connected = docuvend::Consumer::connect({});
//   auto document = consumer.documentURL(bookmark);        // a URL and tokens
//   auto file = consumer.open(document, Access::read);      // start providing, then redeem: true bytes, never a placeholder's zeros
//
// Every call blocks until its answer, an error, or its deadline. One Consumer may be used from several threads. A call whose deadline
// passed may still take effect.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/QXValue.h"
#include "platform/identifiers.h"
#include "sdk/ConsumerErrors.h"
#include "sdk/Result.h"

namespace docuvend {

namespace sdk_detail {
class ServiceConnections;
}

enum class Access { read, readWrite };

// A document, and what opens it.
struct Document {
  QXURL url;
  std::optional<QXData> itemToken;
  std::optional<QXURL> siblingURL;
  std::optional<QXData> siblingToken;
};

class Consumer {
 public:
  struct Options {
    // For an unconfined program: the installed bundle that it acts for. A confined one is known by its launch.
    std::optional<std::string> actAs;
    std::chrono::milliseconds deadline{30'000};
    // Materialising a document may take longer than an answer.
    std::chrono::milliseconds materialisingDeadline{600'000};
  };

  // Fails when XDG_RUNTIME_DIR is not set or the daemon cannot be connected to.
  [[nodiscard]] static Result<std::unique_ptr<Consumer>> connect(Options options);
  ~Consumer();
  Consumer(const Consumer&) = delete;
  Consumer& operator=(const Consumer&) = delete;

  // The bundle that this process acts for: the one in the options, else the one it was launched as.
  [[nodiscard]] std::optional<ConsumerID> ownIdentifier() const;

  [[nodiscard]] Failure wakeUp();
  [[nodiscard]] Result<Document> extendSandbox(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& toConsumer);
  // Has the provider make a placeholder for the item: a file of the right size without the contents.
  [[nodiscard]] Failure providePlaceholder(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer);
  [[nodiscard]] Failure startProviding(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer);
  // Tells the provider that the consumer needs the item's contents no longer.
  [[nodiscard]] Failure stopProviding(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer);
  // Keyed by provider identifier.
  [[nodiscard]] Result<QXDictionary> providers();
  // Grants a document that this application may write to another; the string by which that one finds it.
  [[nodiscard]] Result<std::string> extendBookmark(const QXURL& url, const ConsumerID& toConsumer);
  [[nodiscard]] Result<std::string> bookmarkableString(const QXURL& url);
  [[nodiscard]] Result<Document> documentURL(const std::string& bookmarkableString);

  // Redeems the item's token for an open file. Says nothing about the contents: a placeholder reads as zeros.
  [[nodiscard]] Result<QXDescriptor> redeem(const QXData& token, Access access);
  // Has the provider materialise the document for this application, then redeems.
  [[nodiscard]] Result<QXDescriptor> open(const Document& document, const ProviderID& provider, Access access);
  // Saves so that a reader sees the old contents or the new: writes the hidden sibling through `write`, puts it in the item's place, and
  // tells the provider. `write` returns an error to give up; then nothing has changed.
  [[nodiscard]] Failure replace(const Document& document, const std::function<Failure(const QXDescriptor&)>& write);
  // Tells file coordination that this process has written the document in place, so that its provider hears of the change.
  [[nodiscard]] Failure finishedWriting(const QXURL& url);

 private:
  Consumer(std::shared_ptr<sdk_detail::ServiceConnections> services, Options options);

  const std::shared_ptr<sdk_detail::ServiceConnections> services_;
  const Options options_;
};

}  // namespace docuvend
