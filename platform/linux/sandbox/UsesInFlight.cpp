#include "platform/linux/sandbox/UsesInFlight.h"

#include <algorithm>

namespace docuvend::linux_platform {

UsesInFlight::Use UsesInFlight::begin(std::string path) {
  const std::lock_guard lock(mutex_);
  uses_.emplace(next_, std::move(path));
  return {*this, next_++};
}

void UsesInFlight::end(std::uint64_t number) {
  const std::lock_guard lock(mutex_);
  uses_.erase(number);
  // Under the lock: whoever waits may destroy the counter as soon as it is free.
  over_.notify_all();
}

std::vector<std::string> UsesInFlight::waitForEarlier(const std::vector<std::string>& directories, std::chrono::milliseconds atMost) {
  std::unique_lock lock(mutex_);
  Paths concerned;
  for (const auto& [number, path] : uses_) {
    const auto isAbove = [&path = path](const std::string& directory) { return path.starts_with(directory); };
    if (std::any_of(directories.begin(), directories.end(), isAbove)) concerned.emplace(number, path);
  }
  over_.wait_for(lock, atMost, [this, &concerned] {
    std::erase_if(concerned, [this](const auto& use) { return !uses_.contains(use.first); });
    return concerned.empty();
  });
  std::vector<std::string> late;
  for (auto& [number, path] : concerned) late.push_back(std::move(path));
  return late;
}

}  // namespace docuvend::linux_platform
