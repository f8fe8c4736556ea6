#include "service/DVSandboxTokens.h"

#include "common/DVErrors.h"
#include "platform/QXPlatform.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVHiddenSibling.h"

namespace docuvend {
namespace {

bool owns(const DVExtensionDocuvend& provider, const QXURL& url) {
  const auto owner = DVExtensionDocuvend::providerForURL(url);
  if (!owner) return false;
  const auto identifier = owner->identifier();
  return identifier && identifier == provider.identifier();
}

std::optional<QXData> issuedToken(const QXURL& url) {
  const auto token = QXPlatform::current().sandbox.issueReadWriteExtension(url.fileSystemPath());
  if (!token) return std::nullopt;
  return QXData::fromText(*token);
}

}  // namespace

std::variant<DVSandboxTokens, QXError> dvIssueTokens(const DVExtensionDocuvend& provider, const std::optional<QXURL>& url) {
  if (!url || !owns(provider, *url)) return DVNotPermittedError();

  DVSandboxTokens tokens;
  tokens.siblingURL = dvHiddenSiblingURL(*url);
  tokens.item = issuedToken(*url);
  if (tokens.siblingURL) tokens.sibling = issuedToken(*tokens.siblingURL);
  return tokens;
}

}  // namespace docuvend
