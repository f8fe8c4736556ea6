// The three item operations are alike but not the same, and what differs is meant: a placeholder's provider is found by its identifier
// alone and its early failure is passed on as it is; start and stop find the provider by the URL and wrap an early failure once more; stop
// asks the access control list nothing, and answers with an error also when it has succeeded.
#include <variant>

#include "common/DVErrors.h"
#include "common/DVLog.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVRequests.h"
#include "service/DVRpcServicer.h"

namespace docuvend {

struct DVRpcServicer::ItemRequest {
  using Operation = void (DVExtensionDocuvend::*)(const QXURL&, ErrorReply);

  QXURL url;
  ProviderID providerID;
  ConsumerID consumerID;
  Provider provider;
  ErrorReply reply;
  Operation operation;  // what the provider is asked for when the list allows it
};

namespace {

using FoundProvider = std::variant<std::shared_ptr<DVExtensionDocuvend>, QXError>;

FoundProvider providerNamed(const std::optional<QXURL>& url, const std::optional<ProviderID>& providerID,
                            const std::optional<ConsumerID>& consumerID) {
  if (auto error = dvMissingParameter("URL", url, providerID, consumerID)) return *std::move(error);
  auto provider = DVExtensionDocuvend::providerWithIdentifier(*providerID);
  if (!provider) return DVNotFoundError(*providerID);
  return provider;
}

enum class MismatchCarries { thePassedIdentifier, nothing };

FoundProvider providerOwning(const std::optional<QXURL>& url, const std::optional<ProviderID>& providerID,
                             const std::optional<ConsumerID>& consumerID, MismatchCarries value) {
  if (auto error = dvMissingParameter("URL", url, providerID, consumerID)) return *std::move(error);
  auto provider = DVExtensionDocuvend::providerForURL(*url);
  if (!provider) return DVNotFoundError(*providerID);
  if (provider->identifier() == providerID) return provider;
  return DVInvalidParameterError("providerID",
                                 value == MismatchCarries::thePassedIdentifier ? std::optional(providerID->value) : std::nullopt);
}

}  // namespace

void DVRpcServicer::providePlaceholderForItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                                   std::optional<ConsumerID> forConsumerID, ErrorReply completionHandler) {
  dvLog("[DEBUG] Serving: %@", dvOperationName<&DVDaemon::providePlaceholderForItemAtURL>());
  if (!clientMayAskForItems(completionHandler)) return;
  auto found = providerNamed(url, fromProviderID, forConsumerID);
  if (const auto* error = std::get_if<QXError>(&found)) {
    dvLog("[ERROR] Could not provide placeholder for URL %@ from provider ID %@ to consumer ID %@. Error: %@", url, fromProviderID,
          forConsumerID, *error);
    dvSubmitError(std::move(completionHandler), *error);
    return;
  }
  forwardIfAllowed({*std::move(url), *std::move(fromProviderID), *std::move(forConsumerID), std::get<Provider>(std::move(found)),
                    std::move(completionHandler), &DVExtensionDocuvend::providePlaceholderForItemAtURL});
}

void DVRpcServicer::startProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                            std::optional<ConsumerID> forConsumerID, ErrorReply completionHandler) {
  dvLog("[DEBUG] Serving: %@", dvOperationName<&DVDaemon::startProvidingItemAtURL>());
  if (!clientMayAskForItems(completionHandler)) return;
  auto found = providerOwning(url, fromProviderID, forConsumerID, MismatchCarries::thePassedIdentifier);
  if (const auto* error = std::get_if<QXError>(&found)) {
    dvLog("[ERROR] Cannot provide item at URL %@ from provider ID %@ to consumer ID %@. Error: %@", url, fromProviderID, forConsumerID,
          *error);
    dvSubmitError(std::move(completionHandler), DVNotFoundError(*error));
    return;
  }
  forwardIfAllowed({*std::move(url), *std::move(fromProviderID), *std::move(forConsumerID), std::get<Provider>(std::move(found)),
                    std::move(completionHandler), &DVExtensionDocuvend::startProvidingItemAtURL});
}

void DVRpcServicer::stopProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                           std::optional<ConsumerID> forConsumerID, ErrorReply completionHandler) {
  dvLog("[DEBUG] Serving: %@", dvOperationName<&DVDaemon::stopProvidingItemAtURL>());
  if (!clientMayAskForItems(completionHandler)) return;
  auto found = providerOwning(url, fromProviderID, forConsumerID, MismatchCarries::nothing);
  if (const auto* error = std::get_if<QXError>(&found)) {
    dvLog("[ERROR] Could not stop providing item at URL %@ from provider ID %@ to consumer ID %@. Error: %@", url, fromProviderID,
          forConsumerID, *error);
    dvSubmitError(std::move(completionHandler), DVNotFoundError(*error));
    return;
  }
  std::get<Provider>(found)->stopProvidingItemAtURL(
      *url, [url = *url, providerID = *std::move(fromProviderID), reply = std::move(completionHandler)](std::optional<QXError> error) {
        if (error) dvLog("[ERROR] Could not ask provider ID %@ to stop providing item at URL %@. Error: %@", providerID, url, *error);
        dvReplyWithError(reply, DVPluginOperationFailedError(error));
      });
}

bool DVRpcServicer::clientMayAskForItems(const ErrorReply& reply) const {
  if (clientHasOneOfAllowedEntitlements(kDVReadersAndGranters)) return true;
  if (reply) dvSubmitError(reply, DVClientLacksEntitlement());
  return false;
}

void DVRpcServicer::forwardIfAllowed(ItemRequest request) const {
  const Provider provider = request.provider;
  const QXURL url = request.url;
  provider->itemIDForURL(
      url, [strongSelf = shared_from_this(), request = std::move(request)](std::optional<QXError> error, std::optional<ItemID> itemID) {
        strongSelf->forwardItem(request, error, itemID);
      });
}

void DVRpcServicer::forwardItem(const ItemRequest& request, const std::optional<QXError>& error,
                                const std::optional<ItemID>& itemID) const {
  if (error) {
    dvReplyWithError(request.reply, DVPluginOperationFailedError(error));
    return;
  }
  const auto store = accessControlStore();
  if (store && store->isProviderWithIdentifier(request.providerID, itemID, request.consumerID)) {
    (*request.provider.*request.operation)(request.url, request.reply);
    return;
  }
  dvLog("[ERROR] Consumer ID %@ is not allowed to access item ID “%@” from provider ID %@.", request.consumerID, itemID,
        request.providerID);
  dvReplyWithError(request.reply, DVNotPermittedError());
}

}  // namespace docuvend
