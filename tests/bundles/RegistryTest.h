// A registry over a house of its own, whose changes can be waited for.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <optional>
#include <string>
#include <thread>

#include "platform/linux/bundles/InstalledBundles.h"
#include "tests/bundles/BundleHouse.h"
#include "tests/bundles/InterposedLooks.h"
#include "tests/bundles/InterposedWatches.h"

namespace docuvend::linux_platform {

// Only a registry that notices nothing waits so long.
inline constexpr std::chrono::seconds kLongestWait{30};

class Changes {
 public:
  void note() {
    const std::lock_guard lock(mutex_);
    ++count_;
    changed_.notify_all();
  }
  [[nodiscard]] int count() {
    const std::lock_guard lock(mutex_);
    return count_;
  }
  // Waits until the condition holds, looking after each change.
  template <class Condition>
  [[nodiscard]] bool waitFor(Condition condition) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, kLongestWait, condition);
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  int count_ = 0;
};

class RegistryTest : public ::testing::Test {
 protected:
  void TearDown() override { bundles_.reset(); }  // calls back what a test's own class has

  void start() {
    bundles_.emplace(house_.paths, house_.propertyLists, house_.log.defaultLog());
    bundles_->onChange([this] { changes_.note(); });  // the fixture outlives the registry
  }
  [[nodiscard]] std::string user(const std::string& name) const { return house_.paths.userBundles + "/" + name; }
  [[nodiscard]] bool appears(const std::string& identifier) {
    return changes_.waitFor([this, &identifier] { return bundles_->find(identifier).has_value(); });
  }
  [[nodiscard]] bool disappears(const std::string& identifier) {
    return changes_.waitFor([this, &identifier] { return !bundles_->find(identifier).has_value(); });
  }

  template <class Condition>
  static bool eventually(Condition condition) {
    const auto deadline = std::chrono::steady_clock::now() + kLongestWait;
    while (!condition()) {
      if (std::chrono::steady_clock::now() > deadline) return false;
      std::this_thread::yield();
    }
    return true;
  }
  [[nodiscard]] long logged(const fake_platform::FakeLogEntry& entry) const {
    const auto entries = house_.log.entries();
    return std::count(entries.begin(), entries.end(), entry);
  }

  BundleHouse house_;
  Changes changes_;
  InterposedWatches watches_;
  InterposedLooks looks_;
  std::optional<InstalledBundles> bundles_;
};

}  // namespace docuvend::linux_platform
