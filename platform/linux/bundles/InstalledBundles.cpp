// Watches are set before the directories are read, so that what changes while they are read leads to another look. An installation is many
// changes; they are let settle for a moment, at most kLongestSettling, and then looked at once.
#include "platform/linux/bundles/InstalledBundles.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>

namespace docuvend::linux_platform {
namespace {

constexpr int kForEver = -1;
constexpr int kQuietMilliseconds = 20;
constexpr int kMostWatchTries = 4;
constexpr std::chrono::milliseconds kLongestSettling{500};

bool isSame(const Bundle& one, const Bundle& other) { return one.version == other.version && one.directory == other.directory; }

bool areSame(const BundleMap& one, const BundleMap& other) {
  return std::equal(one.begin(), one.end(), other.begin(), other.end(),
                    [](const auto& a, const auto& b) { return a.first == b.first && isSame(a.second, b.second); });
}

}  // namespace

InstalledBundles::InstalledBundles(const Paths& paths, QXPropertyLists& propertyLists, QXLogHandle& log)
    : paths_(paths), log_(log), stop_(::eventfd(0, EFD_CLOEXEC)), scan_(paths, propertyLists, log) {
  renewWatch();
  bundles_ = std::make_shared<const BundleMap>(scan_.run());
  if (stop_ && watch_.descriptor() >= 0) thread_ = std::thread([this] { run(); });  // joined by the destructor
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
  while (waitForEvents(kForEver)) {
    if (!watch_.takeEvents()) continue;
    settle();
    lookAgain();
  }
}

// False when the registry is to end, or nothing came in time.
bool InstalledBundles::waitForEvents(int timeoutMilliseconds) {
  std::array<pollfd, 2> waiting = {pollfd{stop_.get(), POLLIN, 0}, pollfd{watch_.descriptor(), POLLIN, 0}};
  int count = 0;
  do {
    count = ::poll(waiting.data(), waiting.size(), timeoutMilliseconds);
  } while (count < 0 && errno == EINTR);
  return count > 0 && waiting[0].revents == 0;
}

void InstalledBundles::settle() {
  const auto end = std::chrono::steady_clock::now() + kLongestSettling;
  while (std::chrono::steady_clock::now() < end && waitForEvents(kQuietMilliseconds)) {
    if (!watch_.takeEvents()) return;
  }
}

void InstalledBundles::lookAgain() {
  renewWatch();
  auto looked = std::make_shared<const BundleMap>(scan_.run());
  std::vector<std::function<void()>> callbacks;
  {
    const std::lock_guard lock(mutex_);
    const bool changed = !areSame(*looked, *bundles_);
    bundles_ = std::move(looked);
    if (changed) callbacks = callbacks_;
  }
  for (const auto& callback : callbacks) callback();
}

std::vector<std::string> InstalledBundles::directoriesToWatch() const {
  std::vector<std::string> result;
  for (const auto& root : {paths_.systemBundles, paths_.userBundles}) {
    result.push_back(root);
    const auto directories = bundleDirectories(root);
    result.insert(result.end(), directories.begin(), directories.end());
  }
  return result;
}

// A directory that appears before its parent is watched would go unnoticed; so the list must be the same afterwards.
void InstalledBundles::renewWatch() {
  bool isComplete = true;
  auto directories = directoriesToWatch();
  for (int tries = 0; tries < kMostWatchTries; ++tries) {
    isComplete = watch_.watch(directories);
    auto present = directoriesToWatch();
    if (present == directories) break;
    directories = std::move(present);
  }
  if (!isComplete && watchIsComplete_ && log_.isEnabled(QXLogType::fault)) {
    log_.write(QXLogType::fault, "[ERROR] Not every bundle directory can be watched; changes there are seen late or not at all.");
  }
  watchIsComplete_ = isComplete;
}

}  // namespace docuvend::linux_platform
