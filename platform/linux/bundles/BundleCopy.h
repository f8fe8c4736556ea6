// Copies a bundle's directory, and only what a bundle may hold.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>

#include "platform/QXError.h"
#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

// What one bundle may hold.
struct BundleLimits {
  int depth = 16;  // directories inside each other, the bundle's own among them
  std::size_t entries = 16'384;
  std::uint64_t bytes = 1ULL << 30U;  // of all files
};

// Fills `target`, an empty directory, with what `source` holds, and forces it to disk. Both are open for reading. After an error, which is
// of kBundleErrorDomain or the system's, the target holds some part. A file that grows while it is copied is copied to the length that it
// had.
[[nodiscard]] std::optional<QXError> copyBundle(const UniqueDescriptor& source, const UniqueDescriptor& target,
                                                const BundleLimits& limits = {});

}  // namespace docuvend::linux_platform
