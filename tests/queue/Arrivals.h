// What tasks leave behind for the test: names, in the order of their arrival.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

namespace docuvend {

// How long a test waits for what must happen. Only a failing test ever waits so long.
inline constexpr std::chrono::seconds kPatience{60};

class Arrivals {
 public:
  void arrive(std::string name) {
    const std::lock_guard lock(mutex_);
    names_.push_back(std::move(name));
    changed_.notify_all();
  }

  [[nodiscard]] std::vector<std::string> names() const {
    const std::lock_guard lock(mutex_);
    return names_;
  }

  // False when there were not so many arrivals in all that time.
  [[nodiscard]] bool waitFor(std::size_t count) const {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, kPatience, [this, count] { return names_.size() >= count; });
  }

 private:
  mutable std::mutex mutex_;
  mutable std::condition_variable changed_;
  std::vector<std::string> names_;
};

}  // namespace docuvend
