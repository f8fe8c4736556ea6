// Watches are set before the directories are read, so that what changes while they are read leads to another look. A directory that appears
// is watched at once, not only when it is looked at, so that it is known how long nothing has been written there.
//
// Every look asks for the watches anew. As long as they are not complete a look is due some time after the last one, whatever was heard;
// the first look with all of them sees what was missed before. So it is after a look that did not see everything. What cannot be listed
// stays watched as it was.
#include "platform/linux/bundles/InstalledBundles.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <iterator>
#include <utility>

#include "platform/QXLogMessage.h"

namespace docuvend::linux_platform {
namespace {

using Clock = std::chrono::steady_clock;

constexpr int kForEver = -1;
constexpr int kMostWatchTries = 4;

bool isSame(const Bundle& one, const Bundle& other) { return one.version == other.version && one.directory == other.directory; }

// An installer works under such a name.
bool isHidden(const std::string& bundle) { return bundle[bundle.rfind('/') + 1] == '.'; }

bool areSame(const BundleMap& one, const BundleMap& other) {
  return std::equal(one.begin(), one.end(), other.begin(), other.end(),
                    [](const auto& a, const auto& b) { return a.first == b.first && isSame(a.second, b.second); });
}

}  // namespace

InstalledBundles::InstalledBundles(const Paths& paths, QXPropertyLists& propertyLists, QXLogHandle& log)
    : log_(log),
      stop_(::eventfd(0, EFD_CLOEXEC)),
      roots_{Root{paths.systemBundles, paths.systemBundles}, Root{paths.userBundles, paths.userBundles}},
      scan_(paths, propertyLists, log) {
  lastLook_ = Clock::now();
  renewWatch();
  bundles_ = std::make_shared<const BundleMap>(look(/*unsettled=*/{}));
  if (stop_) thread_ = std::thread([this] { run(); });  // joined by the destructor
}

InstalledBundles::~InstalledBundles() {
  if (!thread_.joinable()) return;
  const std::uint64_t one = 1;
  while (::write(stop_.get(), &one, sizeof(one)) < 0 && errno == EINTR) {
  }
  thread_.join();
}

std::optional<Bundle> InstalledBundles::find(const std::string& identifier) {
  const std::lock_guard lock(mutex_);
  const auto found = bundles_->find(identifier);
  if (found == bundles_->end()) return std::nullopt;
  return found->second;
}

std::vector<Bundle> InstalledBundles::all() {
  std::vector<Bundle> result;
  const std::lock_guard lock(mutex_);
  for (const auto& [identifier, bundle] : *bundles_) result.push_back(bundle);
  return result;
}

void InstalledBundles::onChange(std::function<void()> callback) {
  const std::lock_guard lock(mutex_);
  callbacks_.push_back(std::move(callback));
}

void InstalledBundles::run() {
  while (waitForEvents()) {
    takeChanges();
    const auto next = nextLook();
    if (next && *next <= Clock::now()) lookAgain();
  }
}

std::optional<Settling::Time> InstalledBundles::nextLook() const {
  const auto settled = settling_.nextLook();
  if (watchIsComplete_ && lookIsComplete_) return settled;
  const Settling::Time another = lastLook_ + kLookWithoutWatch;
  return settled ? std::min(*settled, another) : another;
}

// Until something happens or the time for a look has come. False when the registry is to end.
bool InstalledBundles::waitForEvents() {
  std::array<pollfd, 2> waiting = {pollfd{stop_.get(), POLLIN, 0}, pollfd{watch_.descriptor(), POLLIN, 0}};
  int timeout = kForEver;
  if (const auto next = nextLook()) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*next - Clock::now()).count();
    timeout = static_cast<int>(std::max<std::int64_t>(left, 0));
  }
  while (::poll(waiting.data(), waiting.size(), timeout) < 0 && errno == EINTR) {
  }
  return waiting[0].revents == 0;
}

// What was written into a directory before it was watched is not told; so all this counts as of the time when it is.
void InstalledBundles::takeChanges() {
  const auto changes = watch_.takeChanges();
  const auto isForBundles = [this](const DirectoryChange& change) { return !isHidden(bundleAround(realPathOf(change))); };
  if (std::any_of(changes.begin(), changes.end(), [&](const auto& change) { return change.isOfDirectory && isForBundles(change); })) {
    renewWatch();
  }
  const auto now = Clock::now();
  for (const DirectoryChange& change : changes) {
    if (!isForBundles(change)) continue;
    settling_.changed(now);
    const std::string path = realPathOf(change);
    const std::string bundle = bundleAround(path);
    if (bundle.empty()) continue;
    if (path == bundle && change.kind == DirectoryChange::Kind::cameOrWent) {
      settling_.wasRenamed(bundle, now);
    } else {
      settling_.wasWritten(bundle, now);
    }
  }
}

// What changed, below a real directory of bundles if it was below one.
std::string InstalledBundles::realPathOf(const DirectoryChange& change) const {
  std::string path = change.directory;
  if (!change.name.empty()) path += "/" + change.name;
  for (const Root& root : roots_) {
    if (path.starts_with(root.given + "/")) return root.real + path.substr(root.given.size());
  }
  return path;
}

// The directory of the bundle that the path is or lies in; empty when it lies in none.
std::string InstalledBundles::bundleAround(const std::string& path) const {
  for (const Root& root : roots_) {
    if (path.starts_with(root.real + "/")) return path.substr(0, path.find('/', root.real.size() + 1));
  }
  return {};
}

// What was written until it begins is known when the bundles are judged, however late this thread came to it.
void InstalledBundles::lookAgain() {
  renewWatch();
  const auto began = Clock::now();
  takeChanges();
  lastLook_ = began;
  auto looked = std::make_shared<const BundleMap>(look(settling_.unsettled(began)));
  std::vector<std::function<void()>> callbacks;
  bool isChanged = false;
  {
    const std::lock_guard lock(mutex_);
    isChanged = !areSame(*looked, *bundles_);
    bundles_ = std::move(looked);
    if (isChanged) callbacks = callbacks_;
  }
  settling_.looked(began, isChanged ? Settling::Found::changes : Settling::Found::nothingNew);
  for (const auto& callback : callbacks) callback();
}

BundleMap InstalledBundles::look(const std::set<std::string>& unsettled) {
  BundleLook seen = scan_.run(unsettled);
  const bool wasComplete = std::exchange(lookIsComplete_, !seen.notSeen);
  if (wasComplete && seen.notSeen) {
    qxLog(log_, "[ERROR] Not every bundle can be looked at, so what cannot counts as it was and is tried every %d seconds: %@",
          kLookWithoutWatch.count(), *seen.notSeen);
  } else if (!wasComplete && !seen.notSeen) {
    qxLog(log_, "[NOTICE] Every bundle can be looked at again.");
  }
  return std::move(seen.bundles);
}

InstalledBundles::Directories InstalledBundles::directoriesToWatch() const {
  Directories result;
  const auto add = [&result](const std::vector<std::string>& paths) {
    result.paths.insert(result.paths.end(), paths.begin(), paths.end());
  };
  const auto keepBelow = [this, &result](const std::string& directory) {
    result.areAll = false;
    std::copy_if(watched_.begin(), watched_.end(), std::back_inserter(result.paths),
                 [&directory](const std::string& path) { return path.starts_with(directory + "/"); });
  };
  for (const Root& root : roots_) {
    result.paths.push_back(root.given);
    const auto bundles = bundleDirectories(root.given);
    if (std::holds_alternative<QXError>(bundles)) {
      keepBelow(root.real);
      continue;
    }
    for (const auto& bundle : std::get<std::vector<std::string>>(bundles)) {
      const auto directories = directoriesOfBundle(bundle);
      if (const auto* paths = std::get_if<std::vector<std::string>>(&directories)) {
        add(*paths);
      } else {
        result.paths.push_back(bundle);
        keepBelow(bundle);
      }
    }
  }
  return result;
}

// A directory that appears before its parent is watched would go unnoticed; so the list must be the same afterwards.
void InstalledBundles::renewWatch() {
  bool isComplete = true;
  for (Root& root : roots_) {
    auto real = realPath(root.given);
    if (auto* path = std::get_if<std::string>(&real)) root.real = std::move(*path);
  }
  auto directories = directoriesToWatch();
  for (int tries = 0; tries < kMostWatchTries; ++tries) {
    isComplete = watch_.watch(directories.paths) && directories.areAll;
    auto present = directoriesToWatch();
    if (present == directories) break;
    directories = std::move(present);
  }
  watched_ = std::move(directories.paths);
  if (isComplete == watchIsComplete_) return;
  watchIsComplete_ = isComplete;
  if (isComplete) {
    qxLog(log_, "[NOTICE] Every bundle directory is watched again.");
  } else {
    qxLog(log_, "[ERROR] Not every bundle directory can be watched, so they are looked at every %d seconds.", kLookWithoutWatch.count());
  }
}

}  // namespace docuvend::linux_platform
