#include "common/DVErrors.h"
#include "common/DVLog.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVBookmarkableString.h"
#include "service/DVRequests.h"
#include "service/DVRpcServicer.h"
#include "service/DVSandboxTokens.h"

namespace docuvend {
namespace {

// None when the list allows it; logs the refusal.
std::optional<QXError> refusal(const DVBookmarkableString& bookmark, const ConsumerID& consumer) {
  if (DVAccessControlStore::sharedStore()->isProviderIdentifier(bookmark.providerID, bookmark.itemID, consumer)) return std::nullopt;
  dvLog("[ERROR] Provider ID %@ is not allowed to provide item ID “%@” to consumer ID %@", bookmark.providerID, bookmark.itemID, consumer);
  return DVNotPermittedError();
}

}  // namespace

struct DVRpcServicer::StringRequest {
  QXURL url;
  Provider provider;
  StringReply reply;
};

struct DVRpcServicer::DocumentRequest {
  ProviderID providerID;
  ConsumerID consumerID;
  Provider provider;
  DocumentReply reply;
};

void DVRpcServicer::bookmarkableStringFromDocumentURL(std::optional<QXURL> url, StringReply completion) {
  dvLog("[DEBUG] Getting bookmarkable string for URL %@", url);
  const Provider provider = url ? DVExtensionDocuvend::providerForURL(*url) : nullptr;
  if (!provider) {
    dvLog("[INFO] Could not find the provider for URL %@", url);
    if (completion) {
      QXPlatform::current().queues.globalQueue().async(
          [reply = std::move(completion)] { reply(/*bookmarkableString=*/std::nullopt, /*error=*/std::nullopt); });
    }
    return;
  }
  provider->itemIDForURL(
      *url, [request = StringRequest{*url, provider, std::move(completion)}](std::optional<QXError> error, std::optional<ItemID> itemID) {
        replyWithString(request, error, itemID);
      });
}

void DVRpcServicer::replyWithString(const StringRequest& request, const std::optional<QXError>& error,
                                    const std::optional<ItemID>& itemID) {
  if (error) {
    dvReplyWithError(request.reply, *error);
    return;
  }
  const auto providerID = request.provider->identifier();
  std::optional<std::string> string;
  if (providerID && itemID) {
    string = DVBookmarkableString{*providerID, *itemID}.text();
    dvLog("[DEBUG] Successfully generated bookmarkable string “%@” from URL %@.", *string, request.url);
  } else {
    dvLog("[ERROR] Could not get Item ID for URL %@.", request.url);
  }
  if (request.reply) request.reply(std::move(string), /*error=*/std::nullopt);
}

void DVRpcServicer::documentURLFromBookmarkableString(std::optional<std::string> string, DocumentReply completion) {
  dvLog("[DEBUG] Getting URL from bookmarkable string: “%@”.", string);
  const auto consumer = clientBundleIdentifier();
  const auto bookmark = string ? DVBookmarkableString::parse(*string) : std::nullopt;
  std::optional<QXError> error;
  if (!consumer) {
    error = DVNotPermittedError();
  } else if (!bookmark) {
    error = DVInvalidBookmarkableStringError();
  } else {
    error = refusal(*bookmark, *consumer);
  }
  if (error) {
    if (completion) dvSubmitError(std::move(completion), *std::move(error));
    return;
  }

  const Provider provider = DVExtensionDocuvend::providerWithIdentifier(bookmark->providerID);
  // The provider may be away for a moment, as while its extension is updated, and the string stays good: an error would say otherwise.
  // So the request goes unanswered, and the client's own deadline ends it.
  if (!provider) return;
  provider->URLForItemID(bookmark->itemID,
                         [request = DocumentRequest{bookmark->providerID, *consumer, provider, std::move(completion)}](
                             std::optional<QXError> failure, std::optional<QXURL> url) { replyWithDocument(request, failure, url); });
}

void DVRpcServicer::replyWithDocument(const DocumentRequest& request, const std::optional<QXError>& error,
                                      const std::optional<QXURL>& url) {
  if (error) {
    dvReplyWithError(request.reply, DVSandboxExtensionFailedError(url));
    return;
  }
  const auto issued = dvIssueTokens(*request.provider, url);
  if (const auto* refused = std::get_if<QXError>(&issued)) {
    dvLog("[ERROR] Failed to extend sandbox of URL %@ from provider ID %@ to consumer ID %@. Error: %@", url, request.providerID,
          request.consumerID, *refused);
    dvReplyWithError(request.reply, *refused);
    return;
  }
  const auto& tokens = std::get<DVSandboxTokens>(issued);
  dvLog("[INFO] Successfully extended sandbox of URL %@ from provider ID %@ to consumer ID %@.", url, request.providerID,
        request.consumerID);
  if (request.reply) request.reply(url, tokens.item, tokens.siblingURL, tokens.sibling, /*error=*/std::nullopt);
}

}  // namespace docuvend
