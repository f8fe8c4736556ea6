#include "platform/linux/coordination/BytesPresent.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <string>
#include <variant>

#include "platform/linux/sandbox/Resolution.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::int64_t kAllocationUnit = 512;  // of st_blocks, whatever the file system's own block

}  // namespace

std::optional<BytesPresent> BytesPresent::of(const FileKey& file, const QXURL& url) {
  const std::string path = url.fileSystemPath();
  const auto opened = openDirectory(path.substr(0, path.rfind('/') + 1));
  const auto* directory = std::get_if<UniqueDescriptor>(&opened);
  if (directory == nullptr) return std::nullopt;
  const auto found = statusOf(directory->get());
  const auto* known = std::get_if<ObjectStatus>(&found);
  if (known == nullptr || known->identity != file.directory) return std::nullopt;
  struct stat status {};
  if (::fstatat(directory->get(), file.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0 || !S_ISREG(status.st_mode)) return std::nullopt;
  const std::int64_t size = status.st_size;
  return BytesPresent{std::min(status.st_blocks * kAllocationUnit, size), size};
}

}  // namespace docuvend::linux_platform
