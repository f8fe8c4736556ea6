// One thread that submits tasks when their time has come.
#pragma once

#include <chrono>
#include <condition_variable>
#include <map>
#include <mutex>
#include <thread>

#include "platform/queue.h"

namespace docuvend::linux_platform {

// All operations may be called from any thread. The thread begins with the first task.
class QueueTimer {
 public:
  QueueTimer() = default;
  ~QueueTimer();
  QueueTimer(const QueueTimer&) = delete;
  QueueTimer& operator=(const QueueTimer&) = delete;

  // Calls `submit` on the timer's thread, in the order of the due times and for equal ones in the order of the calls. It must be short.
  void add(std::chrono::nanoseconds delay, QXTask submit);

  // Joins the thread and destroys what is not due; what is added later is destroyed at once. Not to be called from `submit`.
  void stop();

 private:
  using Clock = std::chrono::steady_clock;

  void runThread();

  std::mutex mutex_;  // guards what follows
  std::condition_variable changed_;
  std::multimap<Clock::time_point, QXTask> tasks_;
  std::thread thread_;
  bool stopping_ = false;
};

}  // namespace docuvend::linux_platform
