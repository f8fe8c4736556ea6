// The one name of what a URL leads to.
//
// Everything that the daemon hears of a file from another process is put into this form when it comes in. A name with a link in it is a
// question whose answer can be changed between two looks by whoever owns the link; a straight name says the same to everybody who looks.
#pragma once

#include <string>

#include "platform/QXURL.h"

namespace docuvend::linux_platform {

// The URL by the way without links, "." and "..", also of what does not exist yet; a directory's stays a directory's. A URL whose way is
// straight already comes back as it is, percent escapes included, but with one slash where it has several; one that leads nowhere as it is.
[[nodiscard]] QXURL straightURL(const QXURL& url);

// Whether a straight URL is one of something below that directory, which may be reached over links.
[[nodiscard]] bool leadsBelow(const QXURL& straight, const std::string& directory);

}  // namespace docuvend::linux_platform
