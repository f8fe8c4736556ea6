#include "common/DVErrors.h"
#include "common/DVLog.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVRequests.h"
#include "service/DVRpcServicer.h"

namespace docuvend {
namespace {

constexpr std::string_view operationName() { return dvOperationName<&DVDaemon::providersCompletionHandler>(); }

}  // namespace

void DVRpcServicer::providersCompletionHandler(ProvidersReply completionHandler) {
  dvLog("[DEBUG] Serving: %@", operationName());
  if (!clientHasOneOfAllowedEntitlements(kDVReadersAndGranters)) {
    dvLog("[DEBUG] %@: Client is missing entitlement", operationName());
    if (completionHandler) dvSubmitError(std::move(completionHandler), DVClientLacksEntitlement());
    return;
  }
  // The reply tells what there was at the time of the request.
  QXPlatform::current().queues.globalQueue().async(
      [providers = DVExtensionDocuvend::providersInfo(), reply = std::move(completionHandler)] {
        dvLog("[DEBUG] %@: returning providers %@", operationName(), providers);
        if (reply) reply(/*error=*/std::nullopt, providers);
      });
}

}  // namespace docuvend
