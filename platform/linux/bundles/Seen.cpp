#include "platform/linux/bundles/Seen.h"

#include <dirent.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <optional>
#include <string_view>

namespace docuvend::linux_platform {
namespace {

using Kind = DirectoryEntry::Kind;

Kind kindOf(bool isDirectory, bool isLink) {
  if (isDirectory) return Kind::directory;
  return isLink ? Kind::link : Kind::other;
}

// None: it is gone. Not every file system says it with the name.
Seen<std::optional<Kind>> kindOf(const std::string& directory, const dirent& entry) {
  if (entry.d_type != DT_UNKNOWN) return kindOf(entry.d_type == DT_DIR, entry.d_type == DT_LNK);
  const std::string path = directory + "/" + static_cast<const char*>(entry.d_name);
  struct stat status {};
  if (::lstat(path.c_str(), &status) == 0) return kindOf(S_ISDIR(status.st_mode), S_ISLNK(status.st_mode));
  if (!isAnswer(errno)) return notSeen(path, errno);
  return std::nullopt;
}

}  // namespace

bool isAnswer(int error) {
  switch (error) {
    case ENOENT:
    case ENOTDIR:
    case ELOOP:
    case ENAMETOOLONG:
    case EINVAL:
    case EXDEV:
    case EACCES:
    case EPERM:
    case EAGAIN:
      return true;
    default:
      return false;
  }
}

QXError notSeen(const std::string& place, int error) { return QXError::system(error, "cannot look at " + place); }

Seen<std::vector<DirectoryEntry>> entriesOf(const std::string& directory) {
  std::vector<DirectoryEntry> result;
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(::opendir(directory.c_str()), &::closedir);
  if (!stream) return isAnswer(errno) ? Seen<std::vector<DirectoryEntry>>(std::move(result)) : notSeen(directory, errno);
  for (;;) {
    errno = 0;
    const dirent* const entry = ::readdir(stream.get());
    if (entry == nullptr) break;
    const std::string_view name = static_cast<const char*>(entry->d_name);
    if (name == "." || name == "..") continue;
    auto kind = kindOf(directory, *entry);
    if (auto* error = std::get_if<QXError>(&kind)) return std::move(*error);
    if (const auto& known = std::get<std::optional<Kind>>(kind)) result.push_back({std::string(name), *known});
  }
  if (errno != 0 && !isAnswer(errno)) return notSeen(directory, errno);
  std::sort(result.begin(), result.end(), [](const auto& one, const auto& other) { return one.name < other.name; });
  return result;
}

Seen<std::string> realPath(const std::string& path) {
  for (std::size_t end = path.size(); end != 0 && end != std::string::npos; end = path.rfind('/', end - 1)) {
    const std::unique_ptr<char, decltype(&std::free)> real(::realpath(path.substr(0, end).c_str(), nullptr), &std::free);
    if (real) return std::filesystem::path(real.get() + path.substr(end)).lexically_normal().string();
    if (errno == ENOENT || errno == ENOTDIR) continue;
    if (!isAnswer(errno)) return notSeen(path, errno);
    break;
  }
  return path;
}

}  // namespace docuvend::linux_platform
