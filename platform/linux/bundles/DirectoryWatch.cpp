// A watch belongs to a directory, not to a path: when a directory is moved away and another put in its place, the watch stays with the old
// one. So every directory on the way from the root is watched for the one name that the way goes on with, and each change of that name
// leads to a new `watch`.
#include "platform/linux/bundles/DirectoryWatch.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>

namespace docuvend::linux_platform {
namespace {

constexpr unsigned kNames = IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO;
constexpr unsigned kOnTheWay = kNames | IN_ONLYDIR | IN_MASK_ADD;
constexpr unsigned kMoves = IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF;
constexpr unsigned kInside = kNames | IN_MODIFY | IN_CLOSE_WRITE | IN_ATTRIB | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR | IN_MASK_ADD;

bool isAbsent(int error) { return error == ENOENT || error == ENOTDIR; }

}  // namespace

bool DirectoryWatch::watch(const std::vector<std::string>& whole) {
  if (!queue_) queue_.reset(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
  if (!queue_) return false;
  wanted_.clear();
  bool complete = true;
  for (const auto& path : whole) {
    complete = watchWay(path) && complete;
    complete = watchWhole(path) && complete;
  }
  for (const int number : numbers_) {
    if (!wanted_.contains(number)) ::inotify_rm_watch(queue_.get(), number);
  }
  numbers_.clear();
  for (const auto& [number, watched] : wanted_) numbers_.insert(number);
  watches_ = std::move(wanted_);
  return complete;
}

bool DirectoryWatch::watchWhole(const std::string& path) { return add(path, kInside, /*name=*/{}); }

bool DirectoryWatch::watchWay(const std::string& path) {
  bool complete = true;
  for (std::size_t slash = path.find('/'); slash != std::string::npos;) {
    const std::size_t next = path.find('/', slash + 1);
    const std::string name = path.substr(slash + 1, next == std::string::npos ? next : next - slash - 1);
    if (!name.empty()) complete = add(slash == 0 ? "/" : path.substr(0, slash), kOnTheWay, name) && complete;
    slash = next;
  }
  return complete;
}

bool DirectoryWatch::add(const std::string& path, unsigned mask, const std::string& name) {
  const int number = ::inotify_add_watch(queue_.get(), path.c_str(), mask);
  // What this user may not look at may not hold bundles for this user either.
  if (number < 0) return isAbsent(errno) || errno == EACCES;
  const auto [entry, isNew] = wanted_.try_emplace(number, Watched{path, {}});
  auto& names = entry->second.names;
  if (name.empty()) {
    names.clear();
  } else if (isNew || !names.empty()) {
    names.insert(name);
  }
  return true;
}

std::vector<DirectoryChange> DirectoryWatch::takeChanges() {
  std::vector<DirectoryChange> changes;
  if (!queue_) return changes;
  alignas(inotify_event) std::array<char, 16384> bytes{};
  for (;;) {
    const ssize_t count = ::read(queue_.get(), bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return changes;
    for (ssize_t place = 0; place < count;) {
      inotify_event event{};
      std::memcpy(&event, bytes.data() + place, sizeof(event));
      std::string name = event.len == 0 ? std::string() : std::string(bytes.data() + place + sizeof(event));
      place += static_cast<ssize_t>(sizeof(event) + event.len);
      if ((event.mask & IN_Q_OVERFLOW) != 0) changes.push_back({DirectoryChange::Kind::lost, {}, {}, /*isOfDirectory=*/true});
      const auto found = watches_.find(event.wd);
      if (found == watches_.end() || (event.mask & IN_IGNORED) != 0) continue;
      const auto& [path, names] = found->second;
      if (!names.empty() && !names.contains(name)) continue;
      const auto kind = (event.mask & kMoves) != 0 ? DirectoryChange::Kind::cameOrWent : DirectoryChange::Kind::written;
      const bool isOfDirectory = name.empty() || (event.mask & IN_ISDIR) != 0;
      changes.push_back({kind, path, std::move(name), isOfDirectory});
      const auto& change = changes.back();
      if (kind == DirectoryChange::Kind::cameOrWent && !change.name.empty()) forgetBelow(change.directory + "/" + change.name);
    }
  }
}

// The watches themselves are removed by the next `watch`.
void DirectoryWatch::forgetBelow(const std::string& path) {
  std::erase_if(watches_, [&path](const auto& watch) {
    const std::string& other = watch.second.path;
    return other.starts_with(path) && (other.size() == path.size() || other[path.size()] == '/');
  });
}

}  // namespace docuvend::linux_platform
