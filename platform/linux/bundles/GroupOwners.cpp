#include "platform/linux/bundles/GroupOwners.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/bundles/BundleIdentifier.h"
#include "platform/linux/bundles/OwnDirectory.h"
#include "platform/linux/files/PrivateFile.h"

namespace docuvend::linux_platform {

std::variant<std::optional<std::string>, QXError> GroupOwners::ownerOf(const std::string& group) const {
  auto read = readPrivateFile(fileOf(group), kLongestIdentifier + 1);
  if (auto* error = std::get_if<QXError>(&read)) {
    if (error->code == ENOENT) return std::nullopt;
    return std::move(*error);
  }
  auto& text = std::get<std::string>(read);
  const bool isLine = text.ends_with('\n');
  if (isLine) text.pop_back();
  if (!isLine || !isBundleIdentifier(text)) return QXError::system(EINVAL, fileOf(group) + " names no bundle");
  return std::move(text);
}

// The lock makes one of looking and writing: of several that come at once the first one's word counts.
std::variant<std::string, QXError> GroupOwners::record(const std::string& group, const std::string& owner) const {
  auto made = makeOwnDirectory(directory_);
  if (auto* error = std::get_if<QXError>(&made)) return std::move(*error);
  const UniqueDescriptor directory(::open(directory_.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!directory) return QXError::system(errno, "cannot open " + directory_);
  while (::flock(directory.get(), LOCK_EX) != 0) {
    if (errno != EINTR) return QXError::system(errno, "cannot lock " + directory_);
  }
  auto recorded = ownerOf(group);
  if (auto* error = std::get_if<QXError>(&recorded)) return std::move(*error);
  if (auto& first = std::get<std::optional<std::string>>(recorded)) return *std::move(first);
  if (auto error = writePrivateFile(fileOf(group), owner + "\n")) return *std::move(error);
  return owner;
}

}  // namespace docuvend::linux_platform
