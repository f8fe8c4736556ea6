// Small files of this user alone: secrets and records, which nobody else may have read or written.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "platform/QXError.h"

namespace docuvend::linux_platform {

// An error unless it is a regular file of this user with mode 600, one link and at most that length; ENOENT when nothing is there. Never
// waits, whatever somebody put there.
[[nodiscard]] std::variant<std::string, QXError> readPrivateFile(const std::string& path, std::size_t maximumLength);

// Replaces whatever is there, a directory excepted, by such a file, which is on disk when this returns. After an error the old file or
// the new one is there.
[[nodiscard]] std::optional<QXError> writePrivateFile(const std::string& path, std::string_view contents);

}  // namespace docuvend::linux_platform
