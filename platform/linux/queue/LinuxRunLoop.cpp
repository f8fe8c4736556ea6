#include "platform/linux/queue/LinuxRunLoop.h"

#include <utility>

namespace docuvend::linux_platform {

void LinuxRunLoop::run() {
  std::unique_lock lock(mutex_);
  while (true) {
    changed_.wait(lock, [this] { return stopping_ || !tasks_.empty(); });
    if (stopping_) return;
    QXTask task = std::move(tasks_.front());
    tasks_.pop_front();
    lock.unlock();
    task();
    task = {};
    lock.lock();
  }
}

void LinuxRunLoop::perform(QXTask task) {
  const std::lock_guard lock(mutex_);
  tasks_.push_back(std::move(task));
  changed_.notify_one();
}

void LinuxRunLoop::stop() {
  const std::lock_guard lock(mutex_);
  stopping_ = true;
  changed_.notify_one();
}

}  // namespace docuvend::linux_platform
