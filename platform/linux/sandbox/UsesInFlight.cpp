#include "platform/linux/sandbox/UsesInFlight.h"

namespace docuvend::linux_platform {

UsesInFlight::Use UsesInFlight::begin() {
  const std::lock_guard lock(mutex_);
  ++counts_[round_];
  return {*this, round_};
}

void UsesInFlight::end(std::size_t round) {
  const std::lock_guard lock(mutex_);
  // Under the lock: whoever waits may destroy the counter as soon as it is free.
  if (--counts_[round] == 0) over_.notify_all();
}

void UsesInFlight::waitForEarlier() {
  const std::lock_guard oneAtATime(waiting_);
  std::unique_lock lock(mutex_);
  const std::size_t earlier = round_;
  round_ = 1 - round_;
  over_.wait(lock, [this, earlier] { return counts_[earlier] == 0; });
}

}  // namespace docuvend::linux_platform
