// What docuvend-run has to say for itself.
#pragma once

#include <string>

namespace docuvend {

// One line at standard error, whatever stands in the names that it mentions: a bundle's maker chose them.
void complain(const std::string& why);

}  // namespace docuvend
