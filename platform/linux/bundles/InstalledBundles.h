// The installed bundles of this machine and this user, looked at again whenever their directories change.
//
// What is renamed into place is seen as a whole, at once unless it keeps coming and going. What is written in place is seen when nothing
// was written anywhere in its directory for a moment (Settling.h): a copy that goes on without pauses is never seen in part, and one that
// pauses longer is seen as it then is, and again when it goes on; so is one that was under way when the registry was made. As long as a
// bundle that was seen is written to, it counts as it was; its files are those on disk, so a process started from it meanwhile may find a
// program that does not run yet, and the process of the version after that is another. Changes deeper in a bundle than
// kMostBundleDirectories reach are not noticed.
//
// When the kernel has no watch to give, of which a user has only so many, the directories are looked at every kLookWithoutWatch until it
// has; the log says when that begins and when it is over. Meanwhile a bundle that is written in place may be seen in part. So they are when
// something there cannot be looked at (Seen.h): it counts as it was meanwhile (BundleScan.h).
#pragma once

#include <array>
#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "platform/linux/base/Paths.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/bundles/BundleScan.h"
#include "platform/linux/bundles/DirectoryWatch.h"
#include "platform/linux/bundles/Settling.h"

namespace docuvend::linux_platform {

inline constexpr std::chrono::seconds kLookWithoutWatch{3};  // also after one that did not see everything

// The property lists and the log outlive it. The first look is over when the constructor returns.
class InstalledBundles final : public BundleRegistry {
 public:
  InstalledBundles(const Paths& paths, QXPropertyLists& propertyLists, QXLogHandle& log);
  // Waits for a callback that is running. Not to be called from one.
  ~InstalledBundles() override;

  [[nodiscard]] std::optional<Bundle> find(const std::string& identifier) override;
  [[nodiscard]] std::vector<Bundle> all() override;
  void onChange(std::function<void()> callback) override;

 private:
  // A directory of bundles.
  struct Root {
    std::string given;
    std::string real;  // as far as it is known; the same while it does not exist
  };

  void run();
  [[nodiscard]] bool waitForEvents();
  [[nodiscard]] std::optional<Settling::Time> nextLook() const;
  void takeChanges();
  void lookAgain();
  [[nodiscard]] BundleMap look(const std::set<std::string>& unsettled);
  void renewWatch();

  struct Directories {
    std::vector<std::string> paths;
    bool areAll = true;  // otherwise some are there because they were before

    friend bool operator==(const Directories&, const Directories&) = default;
  };
  [[nodiscard]] Directories directoriesToWatch() const;
  [[nodiscard]] std::string realPathOf(const DirectoryChange& change) const;
  [[nodiscard]] std::string bundleAround(const std::string& path) const;

  // Constant after construction.
  QXLogHandle& log_;
  UniqueDescriptor stop_;

  // Used by the constructor, then only by thread_.
  std::array<Root, 2> roots_;
  BundleScan scan_;
  DirectoryWatch watch_;
  Settling settling_;
  std::vector<std::string> watched_;  // what is to be watched
  bool watchIsComplete_ = true;
  bool lookIsComplete_ = true;
  Settling::Time lastLook_;

  std::mutex mutex_;
  std::shared_ptr<const BundleMap> bundles_;      // guarded by mutex_; the map itself never changes
  std::vector<std::function<void()>> callbacks_;  // guarded by mutex_

  std::thread thread_;
};

}  // namespace docuvend::linux_platform
