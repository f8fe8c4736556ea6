// The XML text of a property list.
#pragma once

#include <optional>
#include <string>

#include "platform/QXValue.h"

namespace docuvend::linux_platform {

// The same dictionary always makes the same text: keys are sorted, each level is indented by one tab. None when a property list cannot
// carry the dictionary or reading would refuse it: a value that is absent, a URL, a UUID, an error or a descriptor, a real number that is
// not finite, text that is not UTF-8 or that XML cannot carry, too many elements, too deep, too long.
[[nodiscard]] std::optional<std::string> propertyListXML(const QXDictionary& dictionary);

}  // namespace docuvend::linux_platform
