// The nine errors that this system makes. Each constructor makes one error value of kDVErrorDomain; errors of extensions and of the
// platform are passed on as they come, or stand beneath one of these.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "common/DVErrorCodes.h"
#include "platform/QXError.h"
#include "platform/QXURL.h"
#include "platform/identifiers.h"

namespace docuvend {

[[nodiscard]] QXError DVClientLacksEntitlement();
[[nodiscard]] QXError DVNotPermittedError();
[[nodiscard]] QXError DVInvalidBookmarkableStringError();
// `parameter` is the parameter's name; text "parameter" carries it, text "value" the offending value if there is one.
[[nodiscard]] QXError DVInvalidParameterError(std::string_view parameter, const std::optional<std::string>& value);
// Text "identifier" carries what was not found.
[[nodiscard]] QXError DVNotFoundError(const ProviderID& identifier);
[[nodiscard]] QXError DVNotFoundError(const ItemID& identifier);
[[nodiscard]] QXError DVNotFoundError(const QXError& underlying);
[[nodiscard]] QXError DVNotFoundErrorURL(const QXURL& url);
[[nodiscard]] QXError DVPluginOperationFailedError(const std::optional<QXError>& underlying);
// Text "identifier" carries the provider's identifier.
[[nodiscard]] QXError DVProxyNotFoundError(const std::optional<ProviderID>& provider);
[[nodiscard]] QXError DVSandboxExtensionFailedError(const std::optional<QXURL>& url);

}  // namespace docuvend
