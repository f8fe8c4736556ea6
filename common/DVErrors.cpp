#include "common/DVErrors.h"

#include <memory>

namespace docuvend {
namespace {

QXError make(DVErrorCode code, std::string description) {
  return QXError::make(kDVErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

QXError notFound(const std::string& identifier) {
  QXError error = make(DVErrorCode::notFound, "There is nothing with the identifier " + identifier + ".");
  error.texts.emplace("identifier", identifier);
  return error;
}

}  // namespace

QXError DVClientLacksEntitlement() {
  return make(DVErrorCode::clientLacksEntitlement, "The caller does not hold an entitlement that this operation needs.");
}

QXError DVNotPermittedError() { return make(DVErrorCode::notPermitted, "The operation is not permitted."); }

QXError DVInvalidBookmarkableStringError() {
  return make(DVErrorCode::invalidBookmarkableString, "The string is not a bookmarkable string.");
}

QXError DVInvalidParameterError(std::string_view parameter, const std::optional<std::string>& value) {
  QXError error = make(DVErrorCode::invalidParameter,
                       "The parameter " + std::string(parameter) + (value ? " is invalid: " + *value : std::string(" is invalid.")));
  error.texts.emplace("parameter", parameter);
  if (value) error.texts.emplace("value", *value);
  return error;
}

QXError DVNotFoundError(const ProviderID& identifier) { return notFound(identifier.value); }
QXError DVNotFoundError(const ItemID& identifier) { return notFound(identifier.value); }

QXError DVNotFoundError(const QXError& underlying) {
  QXError error = make(DVErrorCode::notFound, "The item could not be found.");
  error.underlying = std::make_shared<const QXError>(underlying);
  return error;
}

QXError DVNotFoundErrorURL(const QXURL& url) {
  QXError error = make(DVErrorCode::notFoundURL, "No provider owns the URL.");
  error.url = url;
  return error;
}

QXError DVPluginOperationFailedError(const std::optional<QXError>& underlying) {
  QXError error = make(DVErrorCode::pluginOperationFailed, "The provider could not do what was asked.");
  if (underlying) error.underlying = std::make_shared<const QXError>(*underlying);
  return error;
}

QXError DVProxyNotFoundError(const std::optional<ProviderID>& provider) {
  QXError error = make(DVErrorCode::proxyNotFound, "The provider's extension could not be reached.");
  if (provider) error.texts.emplace("identifier", provider->value);
  return error;
}

QXError DVSandboxExtensionFailedError(const std::optional<QXURL>& url) {
  QXError error = make(DVErrorCode::sandboxExtensionFailed, "No sandbox extension could be made.");
  error.url = url;
  return error;
}

}  // namespace docuvend
