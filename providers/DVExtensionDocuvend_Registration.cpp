// A provider is registered with file coordination after its extension has run its own setup. A try is a request, the setup, and the
// registration on the provider's operation queue; a try that fails before that last step is followed by another one a while later, as
// long as the count lasts. The request that failed before there was a proxy is left unfinished.
#include <chrono>
#include <utility>

#include "common/DVErrors.h"
#include "common/DVLog.h"
#include "platform/QXPlatform.h"
#include "providers/DVExtensionDocuvend.h"

namespace docuvend {
namespace {

constexpr std::chrono::nanoseconds kPauseBetweenTries = std::chrono::seconds(2);
constexpr std::int32_t kSingleTry = 1;

}  // namespace

void DVExtensionDocuvend::registerWithFileCoordinatorRetryCount(std::int32_t retryCount, ErrorCompletion completion) {
  if (retryCount == 0) {
    if (!completion) return;
    QXPlatform::current().queues.globalQueue().async(
        [completion = std::move(completion)] { completion(DVPluginOperationFailedError(/*underlying=*/std::nullopt)); });
    return;
  }
  dvLog("[DEBUG] %s", "-[DVExtensionDocuvend registerWithFileCoordinatorRetryCount:completion:]");
  performExtensionRequest([strongSelf = shared_from_this(), retryCount, completion = std::move(completion)](
                              std::optional<QXError> error, std::optional<VendorProxy> proxy, FinishHandler finish) {
    strongSelf->registrationRequestAnswered(retryCount, std::move(error), std::move(proxy), std::move(finish), completion);
  });
}

void DVExtensionDocuvend::registrationRequestAnswered(std::int32_t retryCount, std::optional<QXError> error,
                                                      std::optional<VendorProxy> proxy, FinishHandler finish, ErrorCompletion completion) {
  if (error) {
    dvLog("[ERROR] Error registering docuvend extension %@: %@.", identifier(), error);
    retryRegisterWithFileCoordinatorRetryCount(retryCount, std::move(*error), std::move(completion));
    return;
  }
  proxy->call<&_QXDocuvendVendor::_performInitialSetupWithCompletion>(
      [strongSelf = shared_from_this(), retryCount, finish = std::move(finish), completion = std::move(completion)](
          std::optional<std::string>, std::optional<QXURL>, std::optional<QXError> setupError) {
        strongSelf->initialSetupAnswered(retryCount, std::move(setupError), finish, completion);
      });
}

void DVExtensionDocuvend::initialSetupAnswered(std::int32_t retryCount, std::optional<QXError> error, const FinishHandler& finish,
                                               ErrorCompletion completion) {
  if (error) {
    dvLog("[ERROR] Docuvend extension %@ failed to initialize. Error: %@.", identifier(), error);
    retryRegisterWithFileCoordinatorRetryCount(retryCount, std::move(*error), std::move(completion));
  } else {
    operationQueue_->addOperation(
        [strongSelf = shared_from_this(), completion = std::move(completion)] { strongSelf->operationQueueRegister(completion); });
  }
  finish();
}

void DVExtensionDocuvend::operationQueueRegister(const ErrorCompletion& completion) {
  QXPlatform::current().fileCoordinator._addDocuvend(shared_from_this());
  dvLog("[INFO] Registered docuvend extension %@ for path %@", identifier(), providedItemsURL());
  if (completion) completion(/*error=*/std::nullopt);
}

void DVExtensionDocuvend::retryRegisterWithFileCoordinatorRetryCount(std::int32_t retryCount, QXError lastError,
                                                                     ErrorCompletion completion) {
  if (retryCount < 2) {
    if (completion) completion(std::move(lastError));
    return;
  }
  const std::int32_t triesLeft = retryCount - 1;
  dvLog("[NOTICE] Trying to register docuvend extension %@ again. Tries left: %d", identifier(), triesLeft);
  QXPlatform::current().queues.globalQueue().after(kPauseBetweenTries,
                                                   [strongSelf = shared_from_this(), triesLeft, completion = std::move(completion)] {
                                                     strongSelf->registerWithFileCoordinatorRetryCount(triesLeft, completion);
                                                   });
}

void DVExtensionDocuvend::registerWithFileCoordinatorCompletion(ErrorCompletion completion) {
  registerWithFileCoordinatorRetryCount(kSingleTry, std::move(completion));
}

void DVExtensionDocuvend::unregisterFromFileCoordinator() {
  operationQueue_->addOperation([strongSelf = shared_from_this()] { QXPlatform::current().fileCoordinator._removeDocuvend(strongSelf); });
}

}  // namespace docuvend
