// The installed bundles of this machine and this user, looked at again whenever their directories change.
#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/linux/base/Paths.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/bundles/BundleScan.h"
#include "platform/linux/bundles/DirectoryWatch.h"

namespace docuvend::linux_platform {

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
  void run();
  [[nodiscard]] bool waitForEvents(int timeoutMilliseconds);
  void settle();
  void lookAgain();
  void renewWatch();
  [[nodiscard]] std::vector<std::string> directoriesToWatch() const;

  // Constant after construction.
  const Paths paths_;
  QXLogHandle& log_;
  UniqueDescriptor stop_;

  // Used by the constructor, then only by thread_.
  BundleScan scan_;
  DirectoryWatch watch_;
  bool watchIsComplete_ = true;

  std::mutex mutex_;
  std::shared_ptr<const BundleMap> bundles_;      // guarded by mutex_; the map itself never changes
  std::vector<std::function<void()>> callbacks_;  // guarded by mutex_

  std::thread thread_;
};

}  // namespace docuvend::linux_platform
