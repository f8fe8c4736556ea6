// How a file that is being provided is watched.
#pragma once

#include <sys/stat.h>

#include <algorithm>
#include <chrono>
#include <cstdint>

#include "sdk/Progress.h"

namespace docuvend::sdk_detail {

inline constexpr std::chrono::milliseconds kProgressInterval{200};

// What is allocated of a file is what is present of it: a placeholder is all hole.
inline void report(const struct stat& status, const ProgressHandler& progress) {
  static constexpr std::uint64_t kBytesPerBlock = 512;
  const auto size = static_cast<std::uint64_t>(status.st_size);
  progress({std::min(static_cast<std::uint64_t>(status.st_blocks) * kBytesPerBlock, size), size});
}

}  // namespace docuvend::sdk_detail
