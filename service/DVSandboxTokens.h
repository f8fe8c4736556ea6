// What a consumer is handed to open an item.
#pragma once

#include <optional>
#include <variant>

#include "platform/QXData.h"
#include "platform/QXError.h"
#include "platform/QXURL.h"

namespace docuvend {

class DVExtensionDocuvend;

struct DVSandboxTokens {
  std::optional<QXData> item;       // absent: the platform refused to issue it
  std::optional<QXURL> siblingURL;  // absent: the root has no sibling
  std::optional<QXData> sibling;    // absent as above, and when the platform was not asked
};

// Issues fresh read-write tokens for the item and its hidden sibling. DVNotPermittedError when the URL is absent or lies in no provider's
// directory or in another one's than the given provider's. A token that the platform refuses is no failure. It is not asked for a sibling
// whose URL does not lead to the item's name with a dot in front, beside the item: one of ".", of "..", or of a name with an escaped slash.
// That URL is returned all the same.
[[nodiscard]] std::variant<DVSandboxTokens, QXError> dvIssueTokens(const DVExtensionDocuvend& provider, const std::optional<QXURL>& url);

}  // namespace docuvend
