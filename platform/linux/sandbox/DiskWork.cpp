#include "platform/linux/sandbox/DiskWork.h"

#include <system_error>
#include <utility>

#include "platform/linux/base/LogSubject.h"

namespace docuvend::linux_platform {

DiskWork::DiskWork() {
  const std::lock_guard lock(mutex_);
  try {
    while (threads_.size() < kMostThreads) threads_.emplace_back(&DiskWork::run, this);
  } catch (const std::system_error&) {
    if (threads_.empty()) throw;
  }
}

DiskWork::~DiskWork() {
  {
    const std::lock_guard lock(mutex_);
    stopping_ = true;
  }
  changed_.notify_all();
  for (std::thread& thread : threads_) thread.join();
}

void DiskWork::submit(const std::string& owner, std::function<void()> work) {
  const std::lock_guard lock(mutex_);
  const auto [line, isNew] = lines_.try_emplace(owner);
  line->second.push_back(LogSubject::carrying(std::move(work)));
  if (!isNew) return;
  waiting_.push_back(owner);
  changed_.notify_one();
}

void DiskWork::run() {
  std::unique_lock lock(mutex_);
  while (true) {
    changed_.wait(lock, [this] { return stopping_ || !waiting_.empty(); });
    if (stopping_) return;
    const std::string owner = std::move(waiting_.front());
    waiting_.pop_front();
    const auto line = lines_.find(owner);
    auto work = std::move(line->second.front());
    line->second.pop_front();
    lock.unlock();
    work();
    work = {};
    lock.lock();
    if (line->second.empty()) {
      lines_.erase(line);
    } else {
      waiting_.push_back(owner);
      changed_.notify_one();
    }
  }
}

}  // namespace docuvend::linux_platform
