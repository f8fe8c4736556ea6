// Files that are read or written as a whole, by their paths in this program's own view.
#pragma once

#include <string>

#include "platform/QXValue.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "sdk/CoordinatedAccess.h"
#include "sdk/Result.h"

namespace docuvend::ctl {

// A turn at a file is one at its name, so that a symbolic link would lead to a file of which others have the turn.
//
// Never waits. An error where there is no regular file: a symbolic link (ELOOP), a directory (EISDIR), anything else (EINVAL).
[[nodiscard]] Result<QXDescriptor> openWholeFile(const std::string& path);

// Puts the rest of `contents` in the place of the file to which the access is, or where none is; all or nothing, and on disk when this
// returns. A file that is there keeps its permissions. The same errors; and `connectionLost` when the access was lost meanwhile, so that
// others may have the file: it is untouched.
[[nodiscard]] Failure replaceWholeFile(const CoordinatedAccess& access, int contents);

// A file without a name, for reading and writing, in $TMPDIR or else /tmp.
[[nodiscard]] Result<linux_platform::UniqueDescriptor> temporaryFile();

}  // namespace docuvend::ctl
