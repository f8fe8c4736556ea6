// How a place is named
//
// The path is opened for its location alone (O_PATH: nothing is read, no permission on the file is needed, a pipe does not block), and the
// kernel is asked for the name of what was opened. That name has no links and no "..", and two names of one mount tree compare as texts.
// Comparing device and inode up the tree instead would take a bind mount for the directory that is mounted there.
//
// A file removed between the opening and the question gets a name with a mark at its end. The mark could be part of a real name, so such a
// name counts only if it leads back to the same file.
//
// Where something is missing, the longest beginning of the path that exists is searched for by halves. The first missing component may be
// a link whose target is missing; the place is then where the link points, because that is where a file would appear. Everything here can
// change while it is looked at: a round that meets a change begins again. The path and the links may be somebody's who wants this to take
// long, so the number of lookups has a limit. Links of /proc, which lead where the one who follows them is or looks, are not followed.

#include "platform/linux/files/FilePlace.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <string_view>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kRounds = 8;    // beginnings after a change under way
constexpr int kLookups = 48;  // of one question: a path of any length with links to a few missing targets
constexpr std::string_view kRemovedMark = " (deleted)";

using Text = std::variant<std::string, int>;

Text linkText(int directory, const char* name) {
  std::array<char, PATH_MAX + 1> text{};
  const ssize_t length = ::readlinkat(directory, name, text.data(), text.size());
  if (length < 0) return errno;
  if (static_cast<std::size_t>(length) == text.size()) return ENAMETOOLONG;
  return std::string(text.data(), static_cast<std::size_t>(length));
}

bool leadsTo(const std::string& name, int file) {
  struct stat there {};
  struct stat here {};
  return ::lstat(name.c_str(), &there) == 0 && ::fstat(file, &here) == 0 && there.st_dev == here.st_dev && there.st_ino == here.st_ino;
}

// EAGAIN when the file has been removed since it was opened, or may have been and the cache alone is to say so.
Text kernelName(int file, Lookup lookup = Lookup::complete) {
  Text text = linkText(AT_FDCWD, ("/proc/self/fd/" + std::to_string(file)).c_str());
  const auto* name = std::get_if<std::string>(&text);
  if (name == nullptr) return text;
  if (name->front() != '/') return ESTALE;  // a thing without a place in this process's file system
  if (name->ends_with(kRemovedMark) && (lookup == Lookup::inCacheAlone || !leadsTo(*name, file))) return EAGAIN;
  return text;
}

class Lookups {
 public:
  // For its location alone. ELOOP when there have been too many.
  [[nodiscard]] UniqueDescriptor open(const std::string& path) {
    if (left_ == 0) {
      errno = ELOOP;
      return {};
    }
    --left_;
    open_how how{};
    how.flags = O_PATH | O_CLOEXEC;
    how.resolve = RESOLVE_NO_MAGICLINKS;
    return UniqueDescriptor(static_cast<int>(::syscall(SYS_openat2, AT_FDCWD, path.c_str(), &how, sizeof how)));
  }

 private:
  int left_ = kLookups;
};

// The components of an absolute path, each with the end of the path that it is the last of.
struct Component {
  std::string_view name;
  std::size_t end;
};

std::vector<Component> componentsOf(std::string_view path) {
  std::vector<Component> components;
  for (std::size_t end = 0; end < path.size();) {
    const std::size_t begin = path.find_first_not_of('/', end);
    if (begin == std::string_view::npos) break;
    end = std::min(path.find('/', begin), path.size());
    components.push_back({path.substr(begin, end - begin), end});
  }
  return components;
}

std::string_view firstComponent(std::string_view path) { return path.substr(0, path.find('/')); }

// One round: the place, EAGAIN to begin again, or a link to be followed first.
struct Step {
  std::optional<FilePlace::Result> result;
  std::string path;  // to go on with when there is no result
};

Step finished(FilePlace::Result result) { return {std::move(result), {}}; }

Step followMissingLink(const UniqueDescriptor& directory, const FilePlace& place) {
  const std::string name(firstComponent(place.missing));
  const Text target = linkText(directory.get(), name.c_str());
  if (const int* error = std::get_if<int>(&target)) {
    if (*error == ENOENT) return finished(place);
    return finished(*error == EINVAL ? EAGAIN : *error);  // EINVAL: something has appeared there that is no link
  }
  const auto& text = std::get<std::string>(target);
  return {std::nullopt, (text.starts_with('/') ? text : place.existing + "/" + text) + place.missing.substr(name.size())};
}

Step placed(const UniqueDescriptor& file, std::string missing) {
  Text name = kernelName(file.get());
  if (const int* error = std::get_if<int>(&name)) return finished(*error);
  FilePlace place{std::get<std::string>(std::move(name)), std::move(missing)};
  if (place.missing.empty()) return finished(std::move(place));
  return followMissingLink(file, place);
}

// The path's whole is missing: where it ends to exist.
Step placeOfMissing(const std::string& path, Lookups& lookups) {
  const std::vector<Component> components = componentsOf(path);
  UniqueDescriptor deepest = lookups.open("/");
  if (!deepest) return finished(errno);
  std::size_t existing = 0;
  std::size_t missing = components.size();
  while (existing + 1 < missing) {
    const std::size_t middle = existing + (missing - existing) / 2;
    UniqueDescriptor file = lookups.open(path.substr(0, components[middle - 1].end));
    if (file) {
      deepest = std::move(file);
      existing = middle;
    } else if (errno == ENOENT) {
      missing = middle;
    } else {
      return finished(errno);
    }
  }
  std::string rest;
  for (std::size_t i = existing; i < components.size(); ++i) {
    const std::string_view name = components[i].name;
    if (name == "..") return finished(ENOENT);
    if (name != ".") rest.append(rest.empty() ? "" : "/").append(name);
  }
  return placed(deepest, std::move(rest));
}

Step step(const std::string& path, Lookups& lookups) {
  const UniqueDescriptor file = lookups.open(path);
  if (file) return placed(file, {});
  return errno == ENOENT ? placeOfMissing(path, lookups) : finished(errno);
}

UniqueDescriptor openDirectory(const std::string& path, LastLink lastLink, Lookup lookup) {
  const int flags = O_PATH | O_DIRECTORY | O_CLOEXEC | (lastLink == LastLink::refused ? O_NOFOLLOW : 0);
  if (lookup == Lookup::inCacheAlone) {
    open_how how{};
    how.flags = static_cast<std::uint64_t>(flags);
    how.resolve = RESOLVE_CACHED;
    UniqueDescriptor directory(static_cast<int>(::syscall(SYS_openat2, AT_FDCWD, path.c_str(), &how, sizeof how)));
    if (directory || errno != EINVAL) return directory;
  }
  return UniqueDescriptor(::open(path.c_str(), flags));
}

}  // namespace

FilePlace::Result FilePlace::ofItem(const std::string& path) {
  if (!path.starts_with('/')) return EINVAL;
  Lookups lookups;
  std::string at = path;
  for (int round = 0; round < kRounds;) {
    Step taken = step(at, lookups);
    if (!taken.result) {
      at = std::move(taken.path);
      continue;
    }
    const int* error = std::get_if<int>(&*taken.result);
    if (error == nullptr || *error != EAGAIN) return *std::move(taken.result);
    at = path;
    ++round;
  }
  return EAGAIN;
}

FilePlace::Result FilePlace::ofDirectory(const std::string& path, LastLink lastLink, Lookup lookup) {
  for (int round = 0; round < kRounds; ++round) {
    const UniqueDescriptor file = openDirectory(path, lastLink, lookup);
    if (!file && errno == EAGAIN) continue;  // the cache does not tell, perhaps only because a mount was under way
    if (!file) return errno;
    Text name = kernelName(file.get(), lookup);
    if (auto* existing = std::get_if<std::string>(&name)) return FilePlace{std::move(*existing), {}};
    if (std::get<int>(name) != EAGAIN) return std::get<int>(name);
  }
  return EAGAIN;
}

std::string FilePlace::path() const {
  if (missing.empty()) return existing;
  return existing.ends_with('/') ? existing + missing : existing + "/" + missing;
}

// "." and ".." mean the same to a reader of the text and to the kernel as long as there is no link.
bool FilePlace::isNamedBy(const std::string& path) const {
  std::string text = std::filesystem::path(path).lexically_normal().string();
  if (text.size() > 1 && text.ends_with('/')) text.pop_back();
  return text == this->path();
}

bool FilePlace::isBelow(const FilePlace& directory) const {
  const std::string& above = directory.existing;
  if (existing == above) return !missing.empty();
  return existing.starts_with(above.ends_with('/') ? above : above + "/");
}

}  // namespace docuvend::linux_platform
