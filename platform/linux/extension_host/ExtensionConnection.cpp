#include "platform/linux/extension_host/ExtensionConnection.h"

#include <utility>

#include "platform/linux/rpc/StraightURLs.h"

namespace docuvend::linux_platform {

std::optional<QXValue> ExtensionConnection::valueForEntitlement(const std::string& name) const {
  const auto found = entitlements_.find(name);
  if (found == entitlements_.end()) return std::nullopt;
  return found->second;
}

std::shared_ptr<QXRpcProxy> ExtensionConnection::remoteObjectProxy(QXErrorHandler errorHandler) {
  return withStraightReplies(
      process_->remoteObjectProxy([onFailedMessage = onFailedMessage_, errorHandler = std::move(errorHandler)](const QXError& error) {
        onFailedMessage();
        if (errorHandler) errorHandler(error);
      }));
}

}  // namespace docuvend::linux_platform
