#include "platform/linux/sandbox/DiskWork.h"

#include <algorithm>
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

void DiskWork::submit(const std::string& owner, std::string directory, std::function<void()> work) {
  const std::lock_guard lock(mutex_);
  const auto [line, isNew] = lines_.try_emplace(owner);
  line->second.push_back({std::move(directory), LogSubject::carrying(std::move(work))});
  if (!isNew) return;
  waiting_.push_back(owner);
  changed_.notify_one();
}

std::optional<std::string> DiskWork::takeNextOwner() {
  const auto mayRun = [this](const std::string& owner) {
    const auto running = running_.find(lines_.at(owner).front().directory);
    return running == running_.end() || running->second < kMostThreadsOfDirectory;
  };
  const auto next = std::find_if(waiting_.begin(), waiting_.end(), mayRun);
  if (next == waiting_.end()) return std::nullopt;
  std::string owner = std::move(*next);
  waiting_.erase(next);
  return owner;
}

void DiskWork::run() {
  std::unique_lock lock(mutex_);
  while (true) {
    std::optional<std::string> owner;
    changed_.wait(lock, [this, &owner] { return stopping_ || (owner = takeNextOwner()); });
    if (stopping_) return;
    const auto line = lines_.find(*owner);
    Work work = std::move(line->second.front());
    line->second.pop_front();
    const auto running = running_.try_emplace(work.directory).first;
    ++running->second;
    lock.unlock();
    work.run();
    work.run = {};
    lock.lock();
    if (--running->second == 0) running_.erase(running);
    if (line->second.empty()) {
      lines_.erase(line);
    } else {
      waiting_.push_back(std::move(*owner));
    }
    // There is room in the directory, for this owner or for another.
    if (!waiting_.empty()) changed_.notify_all();
  }
}

}  // namespace docuvend::linux_platform
