#include "platform/linux/sandbox/GroupContainers.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <set>

#include "platform/linux/sandbox/TokenText.h"

namespace docuvend::linux_platform {
namespace {

// What has the name was removed that often while it was looked at: somebody does it on purpose.
constexpr int kLooks = 8;

PathRefusal refusalFor(int code) {
  switch (code) {
    case ELOOP:
      return PathRefusal::symbolicLink;
    case ENOENT:
    case ENOTDIR:
      return PathRefusal::noParent;
    case EAGAIN:
      return PathRefusal::unsteady;
    default:
      return PathRefusal::unreachable;
  }
}

// Doubled slashes become one; everything else that has a second spelling is refused.
std::variant<std::string, PathRefusal> normalised(const std::string& path) {
  if (!path.starts_with('/')) return PathRefusal::notAbsolute;
  if (path.ends_with('/') || path.find('\0') != std::string::npos) return PathRefusal::malformed;
  std::string result;
  std::size_t begin = 0;
  while (begin < path.size()) {
    const std::size_t end = std::min(path.find('/', begin), path.size());
    const std::string_view component = std::string_view(path).substr(begin, end - begin);
    begin = end + 1;
    if (component.empty()) continue;
    if (component == "." || component == "..") return PathRefusal::malformed;
    result += '/';
    result += component;
  }
  if (result.size() > kMaximumTokenPathLength) return PathRefusal::malformed;
  return result;
}

std::string withoutFinalSlashes(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

}  // namespace

std::string_view describe(PathRefusal refusal) {
  switch (refusal) {
    case PathRefusal::notAbsolute:
      return "the path is not absolute";
    case PathRefusal::malformed:
      return "the path is malformed";
    case PathRefusal::outsideContainers:
      return "the path lies in no group container";
    case PathRefusal::noParent:
      return "the file's directory does not exist";
    case PathRefusal::symbolicLink:
      return "the path leads through a symbolic link";
    case PathRefusal::notRegularFile:
      return "the path does not name a regular file";
    case PathRefusal::severalLinks:
      return "the file has several links";
    case PathRefusal::unsteady:
      return "the path does not hold still";
    case PathRefusal::unreachable:
      return "the path cannot be reached";
  }
  return "";
}

GroupContainers::GroupContainers(BundleRegistry& registry) : registry_(registry) {
  registry_.onChange([stale = stale_] { stale->store(true); });
}

std::vector<std::string> GroupContainers::directories() {
  const std::lock_guard lock(mutex_);
  if (stale_->exchange(false)) {
    directories_.clear();
    for (const Bundle& bundle : registry_.all()) {
      for (const auto& [group, directory] : bundle.groups) {
        const std::string plain = withoutFinalSlashes(directory);
        if (plain.size() > 1 && plain.starts_with('/')) directories_.push_back(plain);
      }
    }
    std::sort(directories_.begin(), directories_.end());
    directories_.erase(std::unique(directories_.begin(), directories_.end()), directories_.end());
  }
  return directories_;
}

std::variant<GroupContainers::Root, PathRefusal> GroupContainers::rootOf(const std::string& path) {
  const std::vector<std::string> all = directories();
  // The registry's own spelling first: it costs nothing to compare.
  for (const std::string& directory : all) {
    if (!liesBelow(directory, path)) continue;
    auto opened = openDirectory(directory);
    if (const auto* failure = std::get_if<SystemFailure>(&opened)) return refusalFor(failure->code);
    auto& descriptor = std::get<UniqueDescriptor>(opened);
    auto canonical = kernelPath(descriptor.get());
    if (!canonical) return PathRefusal::unreachable;
    return Root{std::move(descriptor), std::move(*canonical), path.substr(directory.size() + 1)};
  }
  for (const std::string& directory : all) {
    auto opened = openDirectory(directory);
    auto* descriptor = std::get_if<UniqueDescriptor>(&opened);
    if (descriptor == nullptr) continue;
    auto canonical = kernelPath(descriptor->get());
    if (!canonical || !liesBelow(*canonical, path)) continue;
    std::string below = path.substr(canonical->size() + 1);
    return Root{std::move(*descriptor), std::move(*canonical), std::move(below)};
  }
  return PathRefusal::outsideContainers;
}

std::variant<PlacedItem, PathRefusal> GroupContainers::place(const std::string& path, Lookup lookup) {
  auto plain = normalised(path);
  if (const auto* refusal = std::get_if<PathRefusal>(&plain)) return *refusal;
  auto found = rootOf(std::get<std::string>(plain));
  if (const auto* refusal = std::get_if<PathRefusal>(&found)) return *refusal;
  auto& root = std::get<Root>(found);

  PlacedItem item;
  item.path = root.path + "/" + root.below;
  if (item.path.size() > kMaximumTokenPathLength) return PathRefusal::malformed;
  const auto slash = root.below.rfind('/');
  item.name = slash == std::string::npos ? root.below : root.below.substr(slash + 1);
  auto directory =
      openBeneath(root.directory.get(), slash == std::string::npos ? "." : root.below.substr(0, slash), Expecting::directory, lookup);
  if (const auto* failure = std::get_if<SystemFailure>(&directory)) return refusalFor(failure->code);
  item.directory = std::move(std::get<UniqueDescriptor>(directory));

  auto entry = placeEntry(item.directory.get(), item.name, lookup);
  if (const auto* refusal = std::get_if<PathRefusal>(&entry)) return *refusal;
  item.file = std::move(std::get<std::optional<PlacedFile>>(entry));
  return item;
}

// The container that a file lies in is some directory on the way down, or lies itself below the directory; what is below the container
// is spelled as it was asked for. So the links of each part of the way are followed once, and the rest is left as it is.
std::vector<std::string> GroupContainers::spellingsOf(const std::string& directory) {
  const auto normal = normalised(withoutFinalSlashes(directory));
  const auto* plain = std::get_if<std::string>(&normal);
  if (plain == nullptr) return {"/"};
  std::set<std::string> spellings = {*plain + "/"};
  const auto addLinkFree = [&spellings](const std::string& way, const std::string& rest) {
    const auto opened = openDirectory(way);
    const auto* descriptor = std::get_if<UniqueDescriptor>(&opened);
    const auto canonical = descriptor == nullptr ? std::nullopt : kernelPath(descriptor->get());
    if (canonical) spellings.insert(*canonical == "/" ? rest : *canonical + rest);
  };
  for (std::size_t end = plain->size(); end != 0; end = plain->rfind('/', end - 1)) {
    addLinkFree(plain->substr(0, end), plain->substr(end) + "/");
  }
  for (const std::string& container : directories()) {
    if (liesBelow(*plain, container)) addLinkFree(container, "/");
  }
  return {spellings.begin(), spellings.end()};
}

std::variant<std::optional<PlacedFile>, PathRefusal> placeEntry(int directory, const std::string& name, Lookup lookup) {
  for (int look = 0; look < kLooks; ++look) {
    auto opened = openBeneath(directory, name, Expecting::anything, lookup);
    if (const auto* failure = std::get_if<SystemFailure>(&opened)) {
      if (failure->code == ENOENT) return std::optional<PlacedFile>();
      return refusalFor(failure->code);
    }
    auto& path = std::get<UniqueDescriptor>(opened);
    const auto examined = statusOf(path.get());
    if (std::holds_alternative<SystemFailure>(examined)) return PathRefusal::unreachable;
    const auto& status = std::get<ObjectStatus>(examined);
    if (!S_ISREG(status.mode)) return PathRefusal::notRegularFile;
    if (status.links == 0) continue;  // removed since; if it was by an atomic save, another file has the name
    if (status.links != 1) return PathRefusal::severalLinks;
    return std::optional<PlacedFile>(PlacedFile{std::move(path), status.identity});
  }
  return PathRefusal::unsteady;
}

}  // namespace docuvend::linux_platform
