#include "platform/linux/queue/QueueTimer.h"

#include <algorithm>
#include <utility>

namespace docuvend::linux_platform {
namespace {

// Keeps the due time within what the clock can say.
constexpr std::chrono::nanoseconds kLongestDelay = std::chrono::hours(24 * 365 * 20);

}  // namespace

QueueTimer::QueueTimer() : thread_(&QueueTimer::runThread, this) {}

QueueTimer::~QueueTimer() { stop(); }

void QueueTimer::add(std::chrono::nanoseconds delay, QXTask submit) {
  const Clock::time_point due = Clock::now() + std::clamp(delay, std::chrono::nanoseconds::zero(), kLongestDelay);
  const std::lock_guard lock(mutex_);
  if (stopping_) return;  // the caller's copy is destroyed after the lock
  const auto added = tasks_.emplace(due, std::move(submit));
  if (added == tasks_.begin()) changed_.notify_one();
}

void QueueTimer::stop() {
  std::multimap<Clock::time_point, QXTask> never;
  std::thread thread;
  {
    const std::lock_guard lock(mutex_);
    stopping_ = true;
    changed_.notify_one();
    never.swap(tasks_);
    thread.swap(thread_);
  }
  if (thread.joinable()) thread.join();
}

void QueueTimer::runThread() {
  std::unique_lock lock(mutex_);
  while (!stopping_) {
    if (tasks_.empty()) {
      changed_.wait(lock);
      continue;
    }
    const Clock::time_point due = tasks_.begin()->first;
    if (Clock::now() < due) {
      changed_.wait_until(lock, due);
      continue;
    }
    auto next = tasks_.extract(tasks_.begin());
    lock.unlock();
    next.mapped()();
    next = {};
    lock.lock();
  }
}

}  // namespace docuvend::linux_platform
