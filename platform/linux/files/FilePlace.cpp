// How a place is named
//
// The path is opened for its location alone (O_PATH: nothing is read, no permission on the file is needed, a pipe does not block), and the
// kernel is asked for the name of what was opened. That name has no links and no "..", and two names of one mount tree compare as texts.
// Comparing device and inode up the tree instead would take a bind mount for the directory that is mounted there.
//
// A file removed between the opening and the question gets a name with a mark at its end. The mark could be part of a real name, so such a
// name counts only if it leads back to the same file.
//
// What does not exist is split off component by component until something can be opened. The first missing component may be a link whose
// target is missing; the place is then where the link points, because that is where a file would appear. Everything here can change while
// it is looked at: a round that meets a change begins again, a bounded number of times.

#include "platform/linux/files/FilePlace.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <filesystem>
#include <optional>
#include <string_view>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kRounds = 8;  // beginnings after a change under way
constexpr int kLinks = 40;  // links to missing targets in one path, as many as the kernel follows
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

// EAGAIN when the file has been removed since it was opened.
Text kernelName(int file) {
  Text text = linkText(AT_FDCWD, ("/proc/self/fd/" + std::to_string(file)).c_str());
  const auto* name = std::get_if<std::string>(&text);
  if (name == nullptr) return text;
  if (name->front() != '/') return ESTALE;  // a thing without a place in this process's file system
  if (name->ends_with(kRemovedMark) && !leadsTo(*name, file)) return EAGAIN;
  return text;
}

// Takes the last component off, with the slashes around it.
std::string takeLastComponent(std::string& path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  const std::size_t slash = path.rfind('/');
  std::string component = path.substr(slash + 1);
  path.resize(slash + 1);
  return component;
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

Step step(std::string path) {
  std::string missing;
  while (true) {
    const UniqueDescriptor file(::open(path.c_str(), O_PATH | O_CLOEXEC));
    if (file) {
      Text name = kernelName(file.get());
      if (const int* error = std::get_if<int>(&name)) return finished(*error);
      FilePlace place{std::get<std::string>(std::move(name)), std::move(missing)};
      if (place.missing.empty()) return finished(std::move(place));
      return followMissingLink(file, place);
    }
    if (errno != ENOENT || path == "/") return finished(errno);
    const std::string component = takeLastComponent(path);
    if (component == "..") return finished(ENOENT);
    if (component != ".") missing = missing.empty() ? component : component + "/" + missing;
  }
}

}  // namespace

FilePlace::Result FilePlace::ofItem(const std::string& path) {
  if (!path.starts_with('/')) return EINVAL;
  std::string at = path;
  int links = 0;
  for (int round = 0; round < kRounds;) {
    Step taken = step(at);
    if (!taken.result) {
      if (++links > kLinks) return ELOOP;
      at = std::move(taken.path);
      continue;
    }
    const int* error = std::get_if<int>(&*taken.result);
    if (error == nullptr || *error != EAGAIN) return *std::move(taken.result);
    at = path;
    links = 0;
    ++round;
  }
  return EAGAIN;
}

FilePlace::Result FilePlace::ofDirectory(const std::string& path, LastLink lastLink) {
  const int flags = O_PATH | O_DIRECTORY | O_CLOEXEC | (lastLink == LastLink::refused ? O_NOFOLLOW : 0);
  for (int round = 0; round < kRounds; ++round) {
    const UniqueDescriptor file(::open(path.c_str(), flags));
    if (!file) return errno;
    Text name = kernelName(file.get());
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
