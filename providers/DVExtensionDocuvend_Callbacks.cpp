#include <utility>

#include "common/DVLog.h"
#include "platform/QXPlatform.h"
#include "providers/DVExtensionDocuvend.h"

namespace docuvend {

void DVExtensionDocuvend::_provideItemAtURL(const QXURL& url, ProvideCompletion completionHandler) {
  dvLog("[ERROR] Calling deprecated method: %@", "_provideItemAtURL:completionHandler:");
  _provideItemAtURL(url, /*toReaderWithID=*/std::nullopt, std::move(completionHandler));
}

// That the extension knows the item is all that the identifier is asked for.
void DVExtensionDocuvend::_provideItemAtURL(const QXURL& url, const std::optional<QXCoordinationID>& toReaderWithID,
                                            ProvideCompletion completionHandler) {
  const std::optional<std::string> reader = toReaderWithID ? std::optional(toReaderWithID->value) : std::nullopt;
  dvLog("[INFO] QXFileCoordinator requested us to provide item at URL %@ for consumer %@", url, reader);
  itemIDForURL(url, [strongSelf = shared_from_this(), url, reader, completionHandler = std::move(completionHandler)](
                        std::optional<QXError> error, const std::optional<ItemID>& /*itemID*/) {
    strongSelf->readableItemIDAnswered(url, reader, std::move(error), completionHandler);
  });
}

void DVExtensionDocuvend::readableItemIDAnswered(const QXURL& url, const std::optional<std::string>& reader, std::optional<QXError> error,
                                                 ProvideCompletion completionHandler) {
  if (error) {
    dvLog("[ERROR] Could not provide item at URL %@ from extension %@ to reader %@. Error: %@", url, identifier(), reader, error);
    if (completionHandler) completionHandler(std::move(error));
    return;
  }
  QXPlatform::current().queues.globalQueue().async(
      [strongSelf = shared_from_this(), url, completionHandler = std::move(completionHandler)] {
        strongSelf->startProvidingItemAtURL(url, completionHandler);
      });
}

void DVExtensionDocuvend::_writerWithID(const QXCoordinationID& writer, const QXURL& didFinishWritingForURL) {
  const QXURL& url = didFinishWritingForURL;
  dvLog("[INFO] QXFileCoordinator is telling us the item at URL %@ was changed by writer ID %@.", url, writer.value);
  // Looked up afresh: since this object was registered, the directory may have passed to another provider.
  bool excludedURL = false;
  const std::shared_ptr<DVExtensionDocuvend> provider = providerForURL(url, &excludedURL);
  if (provider != nullptr) {
    dvLog("[DEBUG] The item at URL %@ is provided by the etxension %@", url, provider->identifier());
    provider->itemChangedAtURL(url, writer.untilTold);
  } else if (!excludedURL) {
    dvLog("[ERROR] Could not find any extension that provides an item at URL %@", url);
  }
}

void DVExtensionDocuvend::itemChangedAtURL(const QXURL& url, std::shared_ptr<const void> untilTold) {
  dvLog("[DEBUG] %s", "-[DVExtensionDocuvend itemChangedAtURL:]");
  performExtensionRequest([strongSelf = shared_from_this(), url, untilTold = std::move(untilTold)](
                              std::optional<QXError> error, std::optional<VendorProxy> proxy, FinishHandler finish) {
    strongSelf->changeRequestAnswered(url, untilTold, error, proxy, finish);
  });
}

// Unlike the forwarded operations and the registration, a change ends its request also when there is no proxy.
void DVExtensionDocuvend::changeRequestAnswered(const QXURL& url, const std::shared_ptr<const void>& untilTold,
                                                const std::optional<QXError>& error, const std::optional<VendorProxy>& proxy,
                                                const FinishHandler& finish) {
  if (error) {
    dvLog("[ERROR] Cannot tell extension %@ that item at URL %@ has changed.", identifier(), url);
    finish();
    return;
  }
  proxy->call<&_QXDocuvendVendor::_itemChangedAtURL>(
      url, [strongSelf = shared_from_this(), url, untilTold, finish](std::optional<QXError> replyError) {
        strongSelf->changeAnswered(url, replyError, finish);
      });
}

void DVExtensionDocuvend::changeAnswered(const QXURL& url, const std::optional<QXError>& error, const FinishHandler& finish) {
  if (error) dvLog("[ERROR] Could not tell extension %@ that item at URL %@ has changed. Error: %@", identifier(), url, error);
  finish();
}

}  // namespace docuvend
