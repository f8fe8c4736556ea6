// Finds what lies in a bundle by the kernel's own walk, which leaves it nowhere.
#pragma once

#include <string>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

// The kernel gives up on a walk back through ".." that a rename may have led astray, anyone's anywhere. That says nothing of the bundle, so
// the walk is made again, at most so many times in all.
inline constexpr int kMostWalks = 64;

enum class LinksOnTheWay { none, thatStayInside };

// `path` is relative to `bundle`. For its location alone. None: errno says why; EXDEV when the way leads out, ELOOP when it has a link that
// it may not have, EAGAIN when every walk was led astray.
[[nodiscard]] UniqueDescriptor openInBundle(int bundle, const std::string& path, LinksOnTheWay links);

}  // namespace docuvend::linux_platform
