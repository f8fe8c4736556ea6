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
constexpr unsigned kInside = kNames | IN_CLOSE_WRITE | IN_ATTRIB | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR | IN_MASK_ADD;

bool isAbsent(int error) { return error == ENOENT || error == ENOTDIR; }

}  // namespace

DirectoryWatch::DirectoryWatch() : queue_(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {}

bool DirectoryWatch::watch(const std::vector<std::string>& whole) {
  if (!queue_) return false;
  wanted_.clear();
  bool complete = true;
  for (const auto& path : whole) {
    complete = watchWay(path) && complete;
    complete = watchWhole(path) && complete;
  }
  for (const auto& [number, names] : watches_) {
    if (!wanted_.contains(number)) ::inotify_rm_watch(queue_.get(), number);
  }
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
  const auto [entry, isNew] = wanted_.try_emplace(number);
  if (name.empty()) {
    entry->second.clear();
  } else if (isNew || !entry->second.empty()) {
    entry->second.insert(name);
  }
  return true;
}

bool DirectoryWatch::takeEvents() {
  bool matters = false;
  alignas(inotify_event) std::array<char, 16384> bytes{};
  for (;;) {
    const ssize_t count = ::read(queue_.get(), bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return matters;
    for (ssize_t place = 0; place < count;) {
      inotify_event event{};
      std::memcpy(&event, bytes.data() + place, sizeof(event));
      const std::string name = event.len == 0 ? std::string() : std::string(bytes.data() + place + sizeof(event));
      place += static_cast<ssize_t>(sizeof(event) + event.len);
      const auto watch = watches_.find(event.wd);
      if ((event.mask & IN_Q_OVERFLOW) != 0) matters = true;
      if (watch != watches_.end() && (watch->second.empty() || watch->second.contains(name))) matters = true;
    }
  }
}

}  // namespace docuvend::linux_platform
