// One thread that submits tasks when their time has come.
#pragma once

#include <chrono>
#include <condition_variable>
#include <map>
#include <mutex>
#include <thread>

#include "platform/queue.h"

namespace docuvend::linux_platform {

// All operations may be called from any thread. A delay that cannot be kept for want of a thread has nobody to be told of it, so the
// thread is made with the timer; std::system_error when the system has none.
class QueueTimer {
 public:
  QueueTimer();
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
  bool stopping_ = false;
  std::thread thread_;  // the last of them, since it uses the others
};

}  // namespace docuvend::linux_platform
