// The directories of the files that are being written, held open: who owns one may rename it, or a directory above it, and is to be told of
// the write all the same, by the file's new path.
//
// A pure value but for the descriptors. One application's are of a limited number, for descriptors are what everybody needs; of what is
// written beyond that only the path is known.
#pragma once

#include <cstddef>
#include <map>
#include <optional>
#include <utility>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/coordination/AccessHolder.h"
#include "platform/linux/coordination/AccessTable.h"
#include "platform/linux/coordination/FileKey.h"

namespace docuvend::linux_platform {

class HeldDirectory {
 public:
  // None when the file's URL leads to its directory no longer, or the process has no descriptor left.
  [[nodiscard]] static std::optional<HeldDirectory> of(const KeyedFile& file);

  // That file by its path of now; as it was when it has none.
  [[nodiscard]] KeyedFile whereIsNow(const KeyedFile& file) const;

 private:
  explicit HeldDirectory(UniqueDescriptor directory) : directory_(std::move(directory)) {}

  UniqueDescriptor directory_;
};

class WrittenDirectories {
 public:
  static constexpr std::size_t kMaximumHeld = 64;
  static constexpr std::size_t kMaximumUnconfinedHeld = 1024;  // by all unconfined processes together

  // Keeps it for that access, if there is room.
  void add(AccessNumber number, const Application& application, HeldDirectory directory);
  // The access's directory, which is kept no longer.
  [[nodiscard]] std::optional<HeldDirectory> take(AccessNumber number);

 private:
  struct Held {
    Application application;
    HeldDirectory directory;
  };
  std::map<AccessNumber, Held> held_;
  std::map<Application, std::size_t> counts_;  // of held_; none that is 0
};

}  // namespace docuvend::linux_platform
