#include <array>

#include "common/DVErrors.h"
#include "common/DVLog.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVBookmarkableString.h"
#include "service/DVRequests.h"
#include "service/DVRpcServicer.h"
#include "service/DVSandboxTokens.h"

namespace docuvend {
namespace {

constexpr std::array kGranters = {kDVWriteEntitlement};

}  // namespace

struct DVRpcServicer::SandboxRequest {
  QXURL url;
  ProviderID providerID;
  ConsumerID consumerID;
  Provider provider;
  SandboxReply reply;
};

struct DVRpcServicer::BookmarkRequest {
  QXURL url;
  ConsumerID callerID;
  ConsumerID consumerID;
  Provider provider;
  StringReply reply;
};

void DVRpcServicer::extendSandboxForFileURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                            std::optional<ConsumerID> toConsumerID, SandboxReply completionHandler) {
  dvLog("[DEBUG] Serving: %@", dvOperationName<&DVDaemon::extendSandboxForFileURL>());
  if (!clientHasOneOfAllowedEntitlements(kGranters)) {
    if (completionHandler) dvSubmitError(std::move(completionHandler), DVClientLacksEntitlement());
    return;
  }

  Provider provider;
  auto error = dvMissingParameter("URL", url, fromProviderID, toConsumerID);
  if (!error) {
    provider = DVExtensionDocuvend::providerWithIdentifier(*fromProviderID);
    if (!provider) error = DVNotFoundError(*fromProviderID);
  }
  if (error) {
    dvLog("[ERROR] Could not extend sandbox for URL %@ from provider ID %@ to consumer ID %@, error: %@", url, fromProviderID, toConsumerID,
          *error);
    dvSubmitError(std::move(completionHandler), *std::move(error));
    return;
  }

  SandboxRequest request{*std::move(url), *std::move(fromProviderID), *std::move(toConsumerID), provider, std::move(completionHandler)};
  const QXURL itemURL = request.url;
  provider->itemIDForURL(itemURL, [strongSelf = shared_from_this(), request = std::move(request)](std::optional<QXError> failure,
                                                                                                  std::optional<ItemID> itemID) {
    strongSelf->recordGrantAndIssueTokens(request, failure, itemID);
  });
}

// A grant that no file can hold would keep all later ones off the disk as well.
bool DVRpcServicer::recordGrant(const DVGrant& grant, const DVGranter& granter) const {
  const auto store = accessControlStore();
  if (!store || store->allowWhereThereIsRoom(grant, granter)) return true;
  dvLog("[ERROR] The access control list cannot hold provider ID %@, item ID “%@” and consumer ID %@.", grant.provider, grant.item,
        grant.consumer);
  return false;
}

void DVRpcServicer::recordGrantAndIssueTokens(const SandboxRequest& request, const std::optional<QXError>& error,
                                              const std::optional<ItemID>& itemID) const {
  // An extension that answers with neither error nor identifier has failed as well: there is no item that could be granted.
  if (error || !itemID) {
    dvReplyWithError(request.reply, DVPluginOperationFailedError(error));
    return;
  }
  if (!recordGrant({request.providerID, request.consumerID, *itemID}, DVGranter::entitled())) {
    dvReplyWithError(request.reply, DVNotPermittedError());
    return;
  }
  replyWithTokens(request);
}

void DVRpcServicer::replyWithTokens(const SandboxRequest& request) const {
  const auto issued = dvIssueTokens(*request.provider, request.url);
  const auto* tokens = std::get_if<DVSandboxTokens>(&issued);
  if (tokens == nullptr) {
    dvLog("[ERROR] Failed to extend sandbox for URL %@ from provider ID %@ to consumer ID %@.", request.url, request.providerID,
          request.consumerID);
    dvReplyWithError(request.reply, DVSandboxExtensionFailedError(request.url));
    return;
  }
  dvLog("[INFO] Successfully extended sandbox for URL %@ from provider ID %@ to consumer ID %@.", request.url, request.providerID,
        request.consumerID);
  if (request.reply) request.reply(/*error=*/std::nullopt, tokens->item, tokens->siblingURL, tokens->sibling);
}

void DVRpcServicer::extendBookmarkForFileURL(std::optional<QXURL> url, std::optional<ConsumerID> toConsumerID,
                                             StringReply completionHandler) {
  const auto caller = clientBundleIdentifier();
  dvLog("[DEBUG] Extending bookmark privileges for URL: “%@” from bundle %@ to %@.", url, caller, toConsumerID);
  std::optional<QXError> error;
  if (!toConsumerID || !caller) error = DVNotPermittedError();
  // Asked in any case. Who passes on a document must be able to write it already.
  if (!url || !clientHasSandboxAccessToFile(*url)) error = DVNotPermittedError();

  Provider provider;
  if (!error) {
    provider = DVExtensionDocuvend::providerForURL(*url);
    if (!provider) error = DVNotFoundErrorURL(*url);
  }
  if (error) {
    dvLog("[ERROR] Could not extend bookmark privileges for URL %@ from bundle %@ to consumer ID %@, error: %@", url, caller, toConsumerID,
          *error);
    dvSubmitError(std::move(completionHandler), *std::move(error));
    return;
  }

  BookmarkRequest request{*std::move(url), *caller, *std::move(toConsumerID), provider, std::move(completionHandler)};
  const QXURL itemURL = request.url;
  provider->itemIDForURL(itemURL, [strongSelf = shared_from_this(), request = std::move(request)](std::optional<QXError> failure,
                                                                                                  std::optional<ItemID> itemID) {
    strongSelf->recordGrantAndReplyWithString(request, failure, itemID);
  });
}

void DVRpcServicer::recordGrantAndReplyWithString(const BookmarkRequest& request, const std::optional<QXError>& error,
                                                  const std::optional<ItemID>& itemID) const {
  // As for a sandbox grant: no item, nothing to grant. Nor is there anything of a provider that nobody can name.
  const auto providerID = request.provider->identifier();
  if (error || !itemID || !providerID) {
    dvReplyWithError(request.reply, DVPluginOperationFailedError(error));
    return;
  }
  if (!recordGrant({*providerID, request.consumerID, *itemID}, DVGranter::writer(request.callerID))) {
    dvReplyWithError(request.reply, DVNotPermittedError());
    return;
  }
  std::string string = DVBookmarkableString{*providerID, *itemID}.text();
  dvLog("[DEBUG] Successfully generated bookmarkable string “%@” from URL %@.", string, request.url);
  if (request.reply) request.reply(std::move(string), /*error=*/std::nullopt);
}

}  // namespace docuvend
