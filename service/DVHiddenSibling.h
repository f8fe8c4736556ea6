// The hidden sibling of an item: the URL in the same directory whose last component has a "." in front. A consumer that saves atomically
// writes the sibling first.
#pragma once

#include <optional>

#include "platform/QXURL.h"

namespace docuvend {

// Works on the URL's text: percent escapes stay as they are, repeated slashes collapse, a final slash is dropped. None for the root, which
// has no last component.
[[nodiscard]] std::optional<QXURL> dvHiddenSiblingURL(const QXURL& url);

}  // namespace docuvend
