#include "service/DVSandboxTokens.h"

#include <string>

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

std::string lastComponent(const std::string& path) { return path.substr(path.rfind('/') + 1); }

// The sibling's URL is the item's text with a dot in it. An escaped slash or a way up makes that the name of another file, for which
// nobody has asked.
bool isHiddenBeside(const QXURL& sibling, const QXURL& item) {
  const std::string name = lastComponent(item.fileSystemPath());
  return name != "." && name != ".." && lastComponent(sibling.fileSystemPath()) == "." + name;
}

}  // namespace

std::variant<DVSandboxTokens, QXError> dvIssueTokens(const DVExtensionDocuvend& provider, const std::optional<QXURL>& url) {
  if (!url || !owns(provider, *url)) return DVNotPermittedError();

  DVSandboxTokens tokens;
  tokens.siblingURL = dvHiddenSiblingURL(*url);
  tokens.item = issuedToken(*url);
  if (tokens.siblingURL && isHiddenBeside(*tokens.siblingURL, *url)) tokens.sibling = issuedToken(*tokens.siblingURL);
  return tokens;
}

}  // namespace docuvend
