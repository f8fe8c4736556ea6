// One provider extension as this process sees it, and, on the class side, all of them.
//
// Class side: the process-wide registry of providers by provider identifier. It is empty until `createInstancesCompletion` begins a
// continuous match of the installed extensions; from then on every change of the installed set makes one refresh pass, which keeps the
// object of an unchanged extension, makes one for a new or changed extension and registers it with file coordination, and unregisters
// those that vanished or were replaced. All of it is created on first use and never destroyed. Lookups are synchronous reads of a
// concurrent queue, from any thread but that queue's own.
//
// Instance side: identity and storage directory of one extension, the requests that reach its process, its registration with file
// coordination, and the item operations that are forwarded to it. Shared by the registry, by file coordination, and by every
// conversation that is under way; all members may be called from any thread. What is awaited is bounded by the extension host at most: an
// extension that never answers, and whom the host lets be, leaves the completion uncalled and its request open.
//
// Completions run on the thread that delivered the extension's answer unless a member says otherwise. When the message to the extension
// cannot be delivered after its proxy was handed out, a request handler and what stands behind it, completions included, may run a
// second time: whoever gives one tolerates it. An empty completion is never called.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/QXError.h"
#include "platform/QXURL.h"
#include "platform/QXUUID.h"
#include "platform/QXValue.h"
#include "platform/extension_host.h"
#include "platform/file_coordination.h"
#include "platform/identifiers.h"
#include "platform/queue.h"
#include "platform/rpc.h"
#include "platform/rpc_protocol.h"
#include "providers/_QXDocuvendVendor.h"

namespace docuvend {

class DVExtensionDocuvend final : public QXDocuvend, public std::enable_shared_from_this<DVExtensionDocuvend> {
 public:
  using Providers = std::vector<std::shared_ptr<DVExtensionDocuvend>>;
  using Completion = std::function<void()>;
  using ErrorCompletion = std::function<void(std::optional<QXError> error)>;
  using ItemIDCompletion = std::function<void(std::optional<QXError> error, std::optional<ItemID> itemID)>;
  using URLCompletion = std::function<void(std::optional<QXError> error, std::optional<QXURL> url)>;

  using VendorProxy = QXRemote<_QXDocuvendVendor>;
  // Ends the request at the extension host; does nothing for a request that never began. May be called from any thread, and be kept.
  using FinishHandler = std::function<void()>;
  // Of the error and the proxy one is present. Whether and when the request ends is the handler's affair.
  using RequestHandler = std::function<void(std::optional<QXError> error, std::optional<VendorProxy> proxy, FinishHandler finish)>;

  // --- Registry and discovery

  // The first call begins discovery; its completion runs on the global queue when the first pass has registered, or failed to register,
  // every provider. Every later call only submits its completion to the global queue, even while the first pass is under way.
  static void createInstancesCompletion(Completion completion);

  // Registers one after another, in order, with three tries each; a failure is logged and the next one's turn comes. A registration that
  // reports again is logged again if it failed, and nothing else comes of it. The completion then runs once, on the global queue.
  static void refreshOperationsQueueRegisterProviders(Providers providers, Completion completion);

  // Null when no provider is registered under the identifier.
  [[nodiscard]] static std::shared_ptr<DVExtensionDocuvend> providerWithIdentifier(const ProviderID& identifier);

  // Provider identifier to a dictionary of "documentStorageURL" and "providerIdentifier". A provider without a storage directory has an
  // empty one, a provider without an identifier only the URL.
  [[nodiscard]] static QXDictionary providersInfo();

  // --- Resolution

  // The provider whose directory holds the URL, by the file system's own view of the two; null when there is none. A URL that is exactly
  // some provider's directory belongs to nobody and is the one that is excluded. `outExcludedURL`, when given, is always written.
  // A provider that has no directory (none could be derived, or it has not been created yet) is skipped, with a debug line either way.
  [[nodiscard]] static std::shared_ptr<DVExtensionDocuvend> providerForURL(const QXURL& url, bool* outExcludedURL);
  [[nodiscard]] static std::shared_ptr<DVExtensionDocuvend> providerForURL(const QXURL& url);

  // --- Object

  // Never null. What cannot be derived from the extension's bundle is logged and left absent.
  [[nodiscard]] static std::shared_ptr<DVExtensionDocuvend> initWithExtension(std::shared_ptr<QXExtension> extension);

  // A setter returns before the value is stored; a read from the same thread sees it all the same.
  [[nodiscard]] std::shared_ptr<QXExtension> extension() const;
  void setExtension(std::shared_ptr<QXExtension> extension);
  // The extension's own identifier while none is set.
  [[nodiscard]] std::optional<ProviderID> identifier() const;
  void setIdentifier(std::optional<ProviderID> identifier);
  [[nodiscard]] std::optional<QXURL> providedItemsURL() const;
  void setProvidedItemsURL(std::optional<QXURL> url);

  [[nodiscard]] std::optional<QXURL> _providedItemsURL() const override;
  [[nodiscard]] std::shared_ptr<QXOperationQueue> _providedItemsOperationQueue() const override;
  [[nodiscard]] std::optional<std::string> _fileReactorID() const override;

  // --- Requests

  // Starts or reaches the extension's process. The request handler runs on a thread of the extension host, or inside the call.
  void performExtensionRequest(RequestHandler handler);
  // None, without a call of the error handler, when the request has no context, or that no connection. The error handler hears of every
  // message that could not be delivered.
  [[nodiscard]] std::optional<VendorProxy> proxyForIdentifier(const QXUUID& request, QXErrorHandler errorHandler);

  // --- Registration with file coordination

  // Initial setup by the extension, then registration on the operation queue. `retryCount` is the number of tries, two seconds apart; the
  // last one's own error reaches the completion. None at 0, which is an error delivered on the global queue.
  void registerWithFileCoordinatorRetryCount(std::int32_t retryCount, ErrorCompletion completion);
  // After a try that failed with `retryCount` tries left, itself included.
  void retryRegisterWithFileCoordinatorRetryCount(std::int32_t retryCount, QXError lastError, ErrorCompletion completion);
  // A single try.
  void registerWithFileCoordinatorCompletion(ErrorCompletion completion);
  // Takes back one registration, on the operation queue, in no promised order with registrations.
  void unregisterFromFileCoordinator();

  // --- Item operations. Every failure is DVPluginOperationFailedError with its cause beneath it.

  void providePlaceholderForItemAtURL(const QXURL& url, ErrorCompletion completionHandler);
  void startProvidingItemAtURL(const QXURL& url, ErrorCompletion completionHandler);
  void stopProvidingItemAtURL(const QXURL& url, ErrorCompletion completionHandler);
  // Success may come without a value: the extension's answer is passed on as it is.
  void itemIDForURL(const QXURL& url, ItemIDCompletion completionHandler);
  void URLForItemID(const ItemID& itemID, URLCompletion completionHandler);

  // --- What file coordination asks

  // The item must have an identifier; then the extension starts providing it. The reader is printed, and asked nothing: whoever may
  // coordinate a read may have the item.
  void _provideItemAtURL(const QXURL& url, const std::optional<QXCoordinationID>& toReaderWithID,
                         ProvideCompletion completionHandler) override;
  void _provideItemAtURL(const QXURL& url, ProvideCompletion completionHandler) override;
  // Tells the provider that owns the URL now, which need not be this one.
  void _writerWithID(const QXCoordinationID& writer, const QXURL& didFinishWritingForURL) override;
  // Tells the extension; nobody hears of a failure but the log. What is given to be held is let go when the extension has answered, or
  // cannot.
  void itemChangedAtURL(const QXURL& url, std::shared_ptr<const void> untilTold = {});

 private:
  explicit DVExtensionDocuvend(std::shared_ptr<QXExtension> extension);

  void extensionRequestBegan(std::optional<QXUUID> request, std::optional<QXError> error, const RequestHandler& handler);

  void registrationRequestAnswered(std::int32_t retryCount, std::optional<QXError> error, std::optional<VendorProxy> proxy,
                                   FinishHandler finish, ErrorCompletion completion);
  void initialSetupAnswered(std::int32_t retryCount, std::optional<QXError> error, const FinishHandler& finish, ErrorCompletion completion);
  void operationQueueRegister(const ErrorCompletion& completion);

  void readableItemIDAnswered(const QXURL& url, const std::optional<std::string>& reader, std::optional<QXError> error,
                              ProvideCompletion completionHandler);
  void changeRequestAnswered(const QXURL& url, const std::shared_ptr<const void>& untilTold, const std::optional<QXError>& error,
                             const std::optional<VendorProxy>& proxy, const FinishHandler& finish);
  void changeAnswered(const QXURL& url, const std::optional<QXError>& error, const FinishHandler& finish);

  // Fixed after construction
  std::shared_ptr<QXOperationQueue> operationQueue_;
  std::shared_ptr<QXQueue> memberQueue_;

  // Only on memberQueue_: read by synchronous tasks, written by barriers
  std::optional<ProviderID> memberQueueIdentifier_;
  std::shared_ptr<QXExtension> memberQueueExtension_;
  std::optional<QXURL> memberQueueProvidedItemsURL_;
};

}  // namespace docuvend
