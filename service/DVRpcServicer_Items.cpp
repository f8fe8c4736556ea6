#include <array>

#include "common/DVErrors.h"
#include "common/DVLog.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVRequests.h"
#include "service/DVRpcServicer.h"

namespace docuvend {
namespace {

constexpr std::array kReadersAndGranters = {kDVReadEntitlement, kDVWriteEntitlement};

}  // namespace

struct DVRpcServicer::ItemRequest {
  QXURL url;
  ProviderID providerID;
  ConsumerID consumerID;
  Provider provider;
  ErrorReply reply;
};

void DVRpcServicer::startProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                            std::optional<ConsumerID> forConsumerID, ErrorReply completionHandler) {
  dvLog("[DEBUG] Serving: %@", dvOperationName<&DVDaemon::startProvidingItemAtURL>());
  if (!clientHasOneOfAllowedEntitlements(kReadersAndGranters)) {
    if (completionHandler) dvSubmitError(std::move(completionHandler), DVClientLacksEntitlement());
    return;
  }

  Provider provider;
  auto error = dvMissingParameter(url, fromProviderID, forConsumerID);
  if (!error) {
    provider = DVExtensionDocuvend::providerForURL(*url);
    if (!provider) {
      error = DVNotFoundError(*fromProviderID);
    } else if (provider->identifier() != fromProviderID) {
      error = DVInvalidParameterError("providerID", fromProviderID->value);
    }
  }
  if (error) {
    dvLog("[ERROR] Cannot provide item at URL %@ from provider ID %@ to consumer ID %@. Error: %@", url, fromProviderID, forConsumerID,
          *error);
    dvSubmitError(std::move(completionHandler), DVNotFoundError(*error));
    return;
  }

  ItemRequest request{*std::move(url), *std::move(fromProviderID), *std::move(forConsumerID), provider, std::move(completionHandler)};
  const QXURL itemURL = request.url;
  provider->itemIDForURL(itemURL, [strongSelf = shared_from_this(), request = std::move(request)](std::optional<QXError> failure,
                                                                                                  std::optional<ItemID> itemID) {
    strongSelf->startProvidingIfAllowed(request, failure, itemID);
  });
}

void DVRpcServicer::startProvidingIfAllowed(const ItemRequest& request, const std::optional<QXError>& error,
                                            const std::optional<ItemID>& itemID) const {
  if (error) {
    dvReplyWithError(request.reply, DVPluginOperationFailedError(error));
    return;
  }
  const auto store = accessControlStore();
  if (store && store->isProviderWithIdentifier(request.providerID, itemID, request.consumerID)) {
    request.provider->startProvidingItemAtURL(request.url, request.reply);
    return;
  }
  dvLog("[ERROR] Consumer ID %@ is not allowed to access item ID “%@” from provider ID %@.", request.consumerID, itemID,
        request.providerID);
  dvReplyWithError(request.reply, DVNotPermittedError());
}

}  // namespace docuvend
