// Every conversation with an extension is one request: begin it at the extension host, get the proxy of its context, send one operation,
// finish. This file opens the conversation; ending it is the duty of the request handler, and the handlers differ on purpose in whether
// they end a request that failed before there was a proxy.
#include <cassert>
#include <utility>

#include "common/DVErrors.h"
#include "common/DVLog.h"
#include "providers/DVExtensionDocuvend.h"

namespace docuvend {

void DVExtensionDocuvend::performExtensionRequest(RequestHandler handler) {
  assert(handler);
  extension()->beginExtensionRequest(
      [strongSelf = shared_from_this(), handler = std::move(handler)](std::optional<QXUUID> request, std::optional<QXError> error) {
        strongSelf->extensionRequestBegan(request, std::move(error), handler);
      });
}

void DVExtensionDocuvend::extensionRequestBegan(std::optional<QXUUID> request, std::optional<QXError> error,
                                                const RequestHandler& handler) {
  const FinishHandler finish = [strongSelf = shared_from_this(), request] {
    if (request) strongSelf->extension()->cancelExtensionRequest(*request);
  };
  dvLog("[DEBUG] Beginning extension request.");
  if (error) {
    dvLog("[ERROR] Extension request failed. Error: %@", error);
    handler(std::move(error), /*proxy=*/std::nullopt, finish);
    return;
  }
  std::optional<VendorProxy> proxy;
  if (request) {
    proxy = proxyForIdentifier(*request,
                               [handler, finish](const QXError& deliveryError) { handler(deliveryError, /*proxy=*/std::nullopt, finish); });
  }
  if (proxy) {
    handler(/*error=*/std::nullopt, std::move(proxy), finish);
    return;
  }
  dvLog("[ERROR] Could not get proxy object for a request.");
  handler(DVProxyNotFoundError(identifier()), /*proxy=*/std::nullopt, finish);
}

std::optional<DVExtensionDocuvend::VendorProxy> DVExtensionDocuvend::proxyForIdentifier(const QXUUID& request,
                                                                                        QXErrorHandler errorHandler) {
  const std::shared_ptr<QXExtensionContext> context = extension()->extensionContextForRequest(request);
  if (context == nullptr) {
    dvLog("[ERROR] Could not get extension context for request identifier %@", request);
    return std::nullopt;
  }
  const std::shared_ptr<QXRpcConnection> connection = context->auxiliaryConnection();
  if (connection == nullptr) return std::nullopt;
  return VendorProxy(connection->remoteObjectProxy([errorHandler = std::move(errorHandler)](const QXError& error) {
    dvLog("[ERROR] Error getting remote proxy object for provider extension. Error: %@", error);
    if (errorHandler) errorHandler(error);
  }));
}

}  // namespace docuvend
