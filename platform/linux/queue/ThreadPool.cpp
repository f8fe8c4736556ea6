// Waking a thread on another processor costs more than most of the work that is submitted here, so a thread is woken only when nobody is
// looking for work already. "Looking" is a promise: a looking thread looks at the list again before it sleeps, and one that takes a
// piece while more is left, with nobody else looking, wakes the next. So with work in the list and a thread to spare there is always
// somebody looking, and work that arrives while a thread is between two pieces is picked up by that thread.
//
// One thread is there from the beginning, since somebody who uses up the user's processes could keep every later one from being made; the
// others are begun on demand and kept. A thread that waits in `Blocked` lends its place: if work is left another thread is woken or
// begun, up to a bound. That bound is no danger to progress: a blocked `sync` runs the work it waits for itself (QueueCore.cpp),
// whether or not the pool has a thread for it.
#include "platform/linux/queue/ThreadPool.h"

#include <cassert>
#include <system_error>
#include <utility>

namespace docuvend::linux_platform {
namespace {

thread_local ThreadPool* poolOfThisThread = nullptr;

}  // namespace

ThreadPool::ThreadPool(PoolSize size) : size_(size), sleeping_(1) {
  assert(size.atOnce > 0 && size.atMost >= size.atOnce);
  const std::lock_guard lock(mutex_);
  pool_.emplace_back(&ThreadPool::runThread, this, Beginning::asleep);
}

ThreadPool::~ThreadPool() { stop(); }

void ThreadPool::submit(QXTask work) {
  const std::lock_guard lock(mutex_);
  if (stopping_) return;  // the caller's copy is destroyed after the lock
  work_.push_back(std::move(work));
  wakeOneOrGrow();
}

void ThreadPool::stop() {
  assert(poolOfThisThread != this);
  std::vector<std::thread> threads;
  std::deque<QXTask> never;
  {
    const std::lock_guard lock(mutex_);
    stopping_ = true;
    awaken_.notify_all();
    threads.swap(pool_);
    never.swap(work_);
  }
  for (std::thread& thread : threads) thread.join();
}

std::size_t ThreadPool::wakeUps() const {
  const std::lock_guard lock(mutex_);
  return wakeUps_;
}

void ThreadPool::wakeOneOrGrow() {
  if (stopping_ || work_.empty() || looking_ > 0) return;
  if (sleeping_ > 0) {
    --sleeping_;
    ++chosen_;
    ++looking_;
    ++wakeUps_;
    awaken_.notify_one();
  } else if (pool_.size() < size_.atMost && pool_.size() - blocked_ < size_.atOnce) {
    try {
      pool_.emplace_back(&ThreadPool::runThread, this, Beginning::looking);
      ++looking_;
      ++wakeUps_;
    } catch (const std::system_error&) {
      // The system has no thread to spare: those that there are look at the list again when they are done.
    }
  }
}

// Until it is chosen, or false when the pool stops.
bool ThreadPool::sleep(std::unique_lock<std::mutex>& lock) {
  awaken_.wait(lock, [this] { return chosen_ > 0 || stopping_; });
  if (stopping_) return false;
  --chosen_;
  return true;
}

void ThreadPool::runThread(Beginning beginning) {
  poolOfThisThread = this;
  std::unique_lock lock(mutex_);
  if (beginning == Beginning::asleep && !sleep(lock)) return;
  while (true) {
    while (work_.empty() && !stopping_) {
      --looking_;
      ++sleeping_;
      if (!sleep(lock)) return;
    }
    if (stopping_) return;
    QXTask work = std::move(work_.front());
    work_.pop_front();
    --looking_;
    wakeOneOrGrow();
    lock.unlock();
    work();
    work = {};
    lock.lock();
    ++looking_;
  }
}

ThreadPool::Blocked::Blocked(ThreadPool& pool) : pool_(poolOfThisThread == &pool ? &pool : nullptr) {
  if (pool_ == nullptr) return;
  const std::lock_guard lock(pool_->mutex_);
  ++pool_->blocked_;
  pool_->wakeOneOrGrow();
}

ThreadPool::Blocked::~Blocked() {
  if (pool_ == nullptr) return;
  const std::lock_guard lock(pool_->mutex_);
  --pool_->blocked_;
}

}  // namespace docuvend::linux_platform
