// Directories of this user's own, and what others may not have had their hands in.
#pragma once

#include <sys/stat.h>

#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "platform/QXError.h"

namespace docuvend::linux_platform {

// Makes the directory and those above it that are missing, with mode 700 whatever the caller's mask leaves to others. What exists must be
// this user's own directory and no link to one, and is left as it is. Its real path.
[[nodiscard]] std::variant<std::string, QXError> makeOwnDirectory(const std::string& path);

enum class TrustedOwner { thisUser, thisUserOrRoot };

// Why somebody else may have written it, or may do so at any time; the words go on after its name.
[[nodiscard]] std::optional<std::string_view> distrust(const struct stat& status, TrustedOwner owner);

}  // namespace docuvend::linux_platform
