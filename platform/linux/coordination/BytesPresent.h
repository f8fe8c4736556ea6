// How much of a file lies on the disk, while somebody brings it.
#pragma once

#include <cstdint>
#include <optional>

#include "platform/QXURL.h"
#include "platform/linux/coordination/FileKey.h"

namespace docuvend::linux_platform {

struct BytesPresent {
  std::int64_t present = 0;  // never more than `size`
  std::int64_t size = 0;

  // Of the regular file with that key, which the URL named when the key was made. None when there is none, or when the URL leads to another
  // directory by now: whoever may know the one need not be told of the other.
  [[nodiscard]] static std::optional<BytesPresent> of(const FileKey& file, const QXURL& url);

  friend bool operator==(const BytesPresent&, const BytesPresent&) = default;
};

}  // namespace docuvend::linux_platform
