// The threads that run all asynchronous work, first come first served.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/queue.h"

namespace docuvend::linux_platform {

struct PoolSize {
  std::size_t atOnce;  // threads that run; those that wait in a `Blocked` scope do not count. At least 1
  std::size_t atMost;  // all threads. At least `atOnce`
};

// All operations may be called from any thread.
class ThreadPool {
 public:
  // With its first thread; std::system_error when the system has none. The others come when they are wanted, and when the system has none
  // to spare the work waits for those that are there.
  explicit ThreadPool(PoolSize size);
  ~ThreadPool();
  ThreadPool(const ThreadPool&) = delete;
  ThreadPool& operator=(const ThreadPool&) = delete;

  void submit(QXTask work);

  // Lets the work that runs end, joins the threads and destroys the rest; what is submitted later is destroyed at once. Not to be called
  // from work of this pool.
  void stop();

  // While it exists, the calling thread waits for other work. If it is a thread of this pool another may take its place.
  class Blocked {
   public:
    explicit Blocked(ThreadPool& pool);
    ~Blocked();
    Blocked(const Blocked&) = delete;
    Blocked& operator=(const Blocked&) = delete;

   private:
    ThreadPool* const pool_;  // null on a thread of no pool
  };

  // For measurements: how often a sleeping thread was woken or another one begun.
  [[nodiscard]] std::size_t wakeUps() const;

 private:
  enum class Beginning { asleep, looking };

  void runThread(Beginning beginning);
  [[nodiscard]] bool sleep(std::unique_lock<std::mutex>& lock);
  void wakeOneOrGrow();

  const PoolSize size_;

  mutable std::mutex mutex_;  // guards what follows
  std::condition_variable awaken_;
  std::deque<QXTask> work_;
  std::vector<std::thread> pool_;
  std::size_t sleeping_ = 0;  // wait for `awaken_` and were not chosen yet
  std::size_t chosen_ = 0;    // were chosen to wake up and did not yet
  std::size_t looking_ = 0;   // chosen, or between two pieces of work: will look at `work_` before they sleep
  std::size_t blocked_ = 0;
  std::size_t wakeUps_ = 0;
  bool stopping_ = false;
};

}  // namespace docuvend::linux_platform
