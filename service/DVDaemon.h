// What a client may ask of the daemon, at the named service "com.orvane.Docuvend".
//
// Header-only and made of platform values alone: client libraries include it too. URLs are file URLs; an absent error is success; on
// failure every value beside the error is absent. Replies come once, on a thread of the RPC layer at the client.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <tuple>

#include "platform/QXValue.h"
#include "platform/identifiers.h"
#include "platform/rpc_protocol.h"

namespace docuvend {

inline constexpr const char* kDVServiceName = "com.orvane.Docuvend";

class DVDaemon {
 public:
  using Done = std::function<void()>;
  using ErrorReply = std::function<void(std::optional<QXError>)>;
  // An error; the item's sandbox token; its hidden sibling's URL; the sibling's token. A token may be absent on success: the platform
  // refused to issue it.
  using SandboxReply = std::function<void(std::optional<QXError>, std::optional<QXData> itemToken, std::optional<QXURL> siblingURL,
                                          std::optional<QXData> siblingToken)>;
  // Keyed by provider identifier; each value a dictionary with "documentStorageURL" and "providerIdentifier", or less.
  using ProvidersReply = std::function<void(std::optional<QXError>, std::optional<QXDictionary> providers)>;
  using StringReply = std::function<void(std::optional<std::string> bookmarkableString, std::optional<QXError>)>;
  using DocumentReply = std::function<void(std::optional<QXURL>, std::optional<QXData> itemToken, std::optional<QXURL> siblingURL,
                                           std::optional<QXData> siblingToken, std::optional<QXError>)>;

  DVDaemon() = default;
  DVDaemon(const DVDaemon&) = delete;
  DVDaemon& operator=(const DVDaemon&) = delete;
  virtual ~DVDaemon() = default;

  // Makes sure that the daemon runs. Needs no right.
  virtual void wakeUpCompletion(Done completion) = 0;

  // Grants the consumer the item and issues tokens for it. Needs "com.orvane.docuvend.acl-write". A provider that has no name for the item
  // has nothing granted: DVPluginOperationFailedError, with nothing beneath it when the provider gave no error. Nor has a consumer for
  // which the access control list has no room, or which it cannot hold: DVNotPermittedError.
  virtual void extendSandboxForFileURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                       std::optional<ConsumerID> toConsumerID, SandboxReply completionHandler) = 0;

  // Has the provider make a placeholder for the item. Needs "com.orvane.docuvend.acl-read" or "com.orvane.docuvend.acl-write", and a grant.
  // The provider is found by its identifier alone: it is the provider's to refuse a URL that is not its own.
  virtual void providePlaceholderForItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                              std::optional<ConsumerID> forConsumerID, ErrorReply completionHandler) = 0;

  // Has the provider materialise the item. Needs either entitlement, and a grant.
  virtual void startProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                       std::optional<ConsumerID> forConsumerID, ErrorReply completionHandler) = 0;

  // Tells the provider that the consumer needs the item's contents no longer. Needs either entitlement, and no grant. The reply always
  // carries an error: DVPluginOperationFailedError with nothing beneath it is success.
  virtual void stopProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                      std::optional<ConsumerID> forConsumerID, ErrorReply completionHandler) = 0;

  // Lists the providers. Needs either entitlement.
  virtual void providersCompletionHandler(ProvidersReply completionHandler) = 0;

  // Grants the consumer the item and names it in a form that outlives its URL. Needs no entitlement: the caller must be a bundle, and one
  // that may write the file already; an absent URL is refused without asking. An item without a name and a list without room are as
  // above, and so is a provider without an identifier.
  virtual void extendBookmarkForFileURL(std::optional<QXURL> url, std::optional<ConsumerID> toConsumerID,
                                        StringReply completionHandler) = 0;

  // Names the document in a form that outlives its URL. Needs no right. Neither string nor error: no provider owns the URL, or the one
  // that does has no name for the document.
  virtual void bookmarkableStringFromDocumentURL(std::optional<QXURL> url, StringReply completion) = 0;

  // The way back, with fresh tokens. Needs a grant to the caller itself. Never answered when the provider named in the string is not
  // registered: the caller sets its own deadline.
  virtual void documentURLFromBookmarkableString(std::optional<std::string> string, DocumentReply completion) = 0;
};

template <>
struct QXProtocolTable<DVDaemon> {
  static constexpr std::string_view name = "DVDaemon";
  static constexpr auto operations = std::tuple{
      QXOperation<&DVDaemon::wakeUpCompletion>{"wakeUpCompletion:"},
      QXOperation<&DVDaemon::extendSandboxForFileURL>{"extendSandboxForFileURL:fromProviderID:toConsumerID:completionHandler:"},
      QXOperation<&DVDaemon::providePlaceholderForItemAtURL>{
          "providePlaceholderForItemAtURL:fromProviderID:forConsumerID:completionHandler:"},
      QXOperation<&DVDaemon::startProvidingItemAtURL>{"startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:"},
      QXOperation<&DVDaemon::stopProvidingItemAtURL>{"stopProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:"},
      QXOperation<&DVDaemon::providersCompletionHandler>{"providersCompletionHandler:"},
      QXOperation<&DVDaemon::extendBookmarkForFileURL>{"extendBookmarkForFileURL:toConsumerID:completionHandler:"},
      QXOperation<&DVDaemon::bookmarkableStringFromDocumentURL>{"bookmarkableStringFromDocumentURL:completion:"},
      QXOperation<&DVDaemon::documentURLFromBookmarkableString>{"documentURLFromBookmarkableString:completion:"},
  };
};

}  // namespace docuvend
