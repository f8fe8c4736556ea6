// What a path names, by the kernel's own resolution. Nothing here opens a file for reading or writing, and nothing leaves a trace.
#pragma once

#include <sys/types.h>

#include <compare>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>

#include "platform/linux/base/Lookup.h"
#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

// A file or directory, whatever it is called. Inode numbers are used again, so the time of birth belongs to it.
struct ObjectIdentity {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  std::int64_t bornSeconds = 0;
  std::uint32_t bornNanoseconds = 0;

  friend auto operator<=>(const ObjectIdentity&, const ObjectIdentity&) = default;
};

struct ObjectStatus {
  ObjectIdentity identity;
  mode_t mode = 0;
  std::uint32_t links = 0;
};

struct SystemFailure {
  int code = 0;  // an errno value
};

using OpenedPath = std::variant<UniqueDescriptor, SystemFailure>;

[[nodiscard]] std::variant<ObjectStatus, SystemFailure> statusOf(int descriptor);

enum class Expecting { anything, directory };

// O_PATH of what `path` names below the directory: no symbolic link, no way up, no other mount. EAGAIN when more than the cache would have
// to be looked at, and may not be.
[[nodiscard]] OpenedPath openBeneath(int directory, const std::string& path, Expecting expecting, Lookup lookup = Lookup::complete);

enum class FinalLink { followed, itself };

// O_PATH of what the absolute `path` names for a process with that root: links are followed, within that root.
[[nodiscard]] OpenedPath openInRoot(int root, const std::string& path, FinalLink finalLink);

// O_PATH of a directory of this process's own view, links followed.
[[nodiscard]] OpenedPath openDirectory(const std::string& path);

// The path of an open object without any link in it; none when the kernel does not tell.
[[nodiscard]] std::optional<std::string> kernelPath(int descriptor);

// Where this process finds its own open file again.
[[nodiscard]] std::string descriptorPath(int descriptor);

// True when `path` lies below `directory`, both free of links and of a final slash.
[[nodiscard]] bool liesBelow(const std::string& directory, const std::string& path);

}  // namespace docuvend::linux_platform
