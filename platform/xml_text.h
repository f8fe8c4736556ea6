// Which texts a file in XML can hold.
#pragma once

#include <string_view>

namespace docuvend {

// True for valid UTF-8 made of the characters that XML 1.0 can carry.
[[nodiscard]] bool qxIsXMLText(std::string_view text);

}  // namespace docuvend
