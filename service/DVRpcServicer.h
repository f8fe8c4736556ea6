// Serves one client connection: decides whether the caller may make a request, and carries it out.
//
// Its operations run on the connection's own context, one after another, and the servicer holds no state that changes. A request that
// fails before it reaches a provider is answered by a task on the global queue, never inside the call; later answers come on whatever
// thread the provider's own answer came. A provider may answer twice, and then so may a request: the connection takes the first. An empty
// reply handler is never called. A grant or an item operation that is under way keeps the servicer alive, also when its client has left.
//
// One source per concern: DVRpcServicer_Checks, _Grants, _Items, _Listing, _Bookmarks.
#pragma once

#include <array>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "acl/DVGrantLimits.h"
#include "platform/rpc.h"
#include "service/DVAccessControlSource.h"
#include "service/DVDaemon.h"

namespace docuvend {

class DVExtensionDocuvend;

// Each counts as held when its value is a number that is not zero, or true.
inline constexpr std::string_view kDVReadEntitlement = "com.orvane.docuvend.acl-read";
inline constexpr std::string_view kDVWriteEntitlement = "com.orvane.docuvend.acl-write";
// Either is enough to ask for items and for the list of providers. They are looked at, and logged, in this order.
inline constexpr std::array kDVReadersAndGranters = {kDVReadEntitlement, kDVWriteEntitlement};

class DVRpcServicer final : public DVDaemon, public std::enable_shared_from_this<DVRpcServicer> {
 public:
  DVRpcServicer(std::weak_ptr<DVAccessControlSource> server, std::weak_ptr<QXRpcConnection> connection)
      : server_(std::move(server)), connection_(std::move(connection)) {}

  // Null when it has gone away.
  [[nodiscard]] std::shared_ptr<DVAccessControlSource> server() const { return server_.lock(); }
  [[nodiscard]] std::shared_ptr<QXRpcConnection> connection() const { return connection_.lock(); }

  // True when the client holds at least one; otherwise the refusal is logged here. The caller makes the error.
  [[nodiscard]] bool clientHasOneOfAllowedEntitlements(std::span<const std::string_view> entitlements) const;
  // True when the client could write the file itself: only then may it be trusted with access to it. Logs nothing.
  [[nodiscard]] bool clientHasSandboxAccessToFile(const QXURL& url) const;

  void wakeUpCompletion(Done completion) override;
  void extendSandboxForFileURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> toConsumerID,
                               SandboxReply completionHandler) override;
  void providePlaceholderForItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                      std::optional<ConsumerID> forConsumerID, ErrorReply completionHandler) override;
  void startProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> forConsumerID,
                               ErrorReply completionHandler) override;
  void stopProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> forConsumerID,
                              ErrorReply completionHandler) override;
  void providersCompletionHandler(ProvidersReply completionHandler) override;
  void extendBookmarkForFileURL(std::optional<QXURL> url, std::optional<ConsumerID> toConsumerID, StringReply completionHandler) override;
  void bookmarkableStringFromDocumentURL(std::optional<QXURL> url, StringReply completion) override;
  void documentURLFromBookmarkableString(std::optional<std::string> string, DocumentReply completion) override;

 private:
  using Provider = std::shared_ptr<DVExtensionDocuvend>;

  // What a request carries from its first step to its reply.
  struct SandboxRequest;
  struct BookmarkRequest;
  struct ItemRequest;
  struct StringRequest;
  struct DocumentRequest;

  // All zero when the connection has gone away.
  [[nodiscard]] QXAuditToken clientAuditToken() const;
  [[nodiscard]] std::optional<ConsumerID> clientBundleIdentifier() const;
  // Null when the server or its store has gone away.
  [[nodiscard]] std::shared_ptr<DVAccessControlStore> accessControlStore() const;

  // --- Grants

  // False, with a line, when the list cannot hold it.
  [[nodiscard]] bool recordGrant(const DVGrant& grant, const DVGranter& granter) const;
  void recordGrantAndIssueTokens(const SandboxRequest& request, const std::optional<QXError>& error,
                                 const std::optional<ItemID>& itemID) const;
  void replyWithTokens(const SandboxRequest& request) const;
  void recordGrantAndReplyWithString(const BookmarkRequest& request, const std::optional<QXError>& error,
                                     const std::optional<ItemID>& itemID) const;

  // --- Item operations
  // False: the client has been answered.
  [[nodiscard]] bool clientMayAskForItems(const ErrorReply& reply) const;
  void forwardIfAllowed(ItemRequest request) const;
  void forwardItem(const ItemRequest& request, const std::optional<QXError>& error, const std::optional<ItemID>& itemID) const;

  // --- Bookmarkable strings
  static void replyWithString(const StringRequest& request, const std::optional<QXError>& error, const std::optional<ItemID>& itemID);
  static void replyWithDocument(const DocumentRequest& request, const std::optional<QXError>& error, const std::optional<QXURL>& url);

  // Constant after construction.
  const std::weak_ptr<DVAccessControlSource> server_;
  const std::weak_ptr<QXRpcConnection> connection_;
};

}  // namespace docuvend
