#include "sdk/ProviderWork.h"

#include <algorithm>
#include <cassert>
#include <system_error>
#include <utility>

namespace docuvend {

WorkerThreads::~WorkerThreads() {
  assert(isFinished_ && running_ == 0);
  for (std::thread& thread : threads_) thread.join();
}

void WorkerThreads::perform(std::function<void()> work) {
  const std::lock_guard lock(mutex_);
  if (isFinished_) return;
  waiting_.push_back(std::move(work));
  if (idle_ < waiting_.size() && threads_.size() < limit_) addThread();
  changed_.notify_one();
}

// A process at its limit of threads goes on with those that it has.
void WorkerThreads::addThread() {
  try {
    threads_.emplace_back([this] { run(); });  // joined before this object goes
  } catch (const std::system_error&) {
    if (threads_.empty()) throw;
  }
}

bool WorkerThreads::finish(std::chrono::milliseconds patience) {
  std::unique_lock lock(mutex_);
  isFinished_ = true;
  waiting_.clear();
  changed_.notify_all();
  return changed_.wait_for(lock, patience, [this] { return running_ == 0; });
}

void WorkerThreads::run() {
  std::unique_lock lock(mutex_);
  for (;;) {
    ++idle_;
    changed_.wait(lock, [this] { return isFinished_ || !waiting_.empty(); });
    --idle_;
    if (isFinished_) return;
    std::function<void()> work = std::move(waiting_.front());
    waiting_.pop_front();
    ++running_;
    lock.unlock();
    work();
    work = {};
    lock.lock();
    --running_;
    if (isFinished_) changed_.notify_all();
  }
}

void ProviderWork::performForItem(const std::string& key, std::function<void()> work) {
  {
    const std::lock_guard lock(mutex_);
    const auto [queue, isFirst] = queues_.try_emplace(key);
    queue->second.push_back(std::move(work));
    if (!isFirst) return;
  }
  long_.perform([this, key] { runNext(key); });  // this object waits for its work
}

void ProviderWork::runNext(const std::string& key) {
  std::function<void()> work;
  {
    const std::lock_guard lock(mutex_);
    work = std::move(queues_.at(key).front());
    queues_.at(key).pop_front();
  }
  work();
  {
    const std::lock_guard lock(mutex_);
    const auto queue = queues_.find(key);
    if (queue->second.empty()) {
      queues_.erase(queue);
      return;
    }
  }
  long_.perform([this, key] { runNext(key); });  // this object waits for its work
}

bool ProviderWork::finish(std::chrono::milliseconds patience) {
  const auto deadline = std::chrono::steady_clock::now() + patience;
  const bool isQuickDone = quick_.finish(patience);
  const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
  const bool isLongDone = long_.finish(std::max(left, std::chrono::milliseconds(0)));
  return isQuickDone && isLongDone;
}

}  // namespace docuvend
