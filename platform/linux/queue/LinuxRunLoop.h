// The main thread's loop.
#pragma once

#include <condition_variable>
#include <deque>
#include <mutex>

#include "platform/queue.h"

namespace docuvend::linux_platform {

class LinuxRunLoop final : public QXRunLoop {
 public:
  // Runs until `stop`. What is left then is destroyed with the loop.
  void run() override;
  void perform(QXTask task) override;

  // Makes `run` return after the task that it runs. From any thread; the daemon never does.
  void stop();

 private:
  std::mutex mutex_;  // guards what follows
  std::condition_variable changed_;
  std::deque<QXTask> tasks_;
  bool stopping_ = false;
};

}  // namespace docuvend::linux_platform
