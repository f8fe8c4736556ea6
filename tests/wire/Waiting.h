// Waiting for what another thread does: as long as it takes, within a bound that only a broken program reaches.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <deque>
#include <mutex>
#include <optional>
#include <utility>

namespace docuvend::tests {

inline constexpr std::chrono::seconds kPatience{60};

// Values from other threads, in the order of their arrival.
template <class T>
class Mailbox {
 public:
  void put(T value) {
    const std::lock_guard lock(mutex_);
    values_.push_back(std::move(value));
    arrived_.notify_all();
  }
  // The next one; none when it does not come.
  std::optional<T> take() {
    std::unique_lock lock(mutex_);
    if (!arrived_.wait_for(lock, kPatience, [this] { return !values_.empty(); })) return std::nullopt;
    T value = std::move(values_.front());
    values_.pop_front();
    return value;
  }
  [[nodiscard]] std::size_t count() const {
    const std::lock_guard lock(mutex_);
    return values_.size();
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable arrived_;
  std::deque<T> values_;
};

}  // namespace docuvend::tests
