#include "platform/linux/queue/LinuxQueue.h"

#include <cassert>
#include <utility>

#include "platform/linux/base/LogSubject.h"
#include "platform/linux/queue/CurrentQueue.h"

namespace docuvend::linux_platform {
namespace {

// The global queue's identity: there is one for all pools.
constexpr char kGlobalQueue = 0;

}  // namespace

LinuxQueue::LinuxQueue(std::shared_ptr<QueueCore> core, std::shared_ptr<QueueTimer> timer)
    : core_(std::move(core)), timer_(std::move(timer)) {}

void LinuxQueue::sync(const QXTask& task) {
  const std::shared_ptr<QueueCore> core = core_;  // the task may release the last handle
  core->sync(task);
}

void LinuxQueue::after(std::chrono::nanoseconds delay, QXTask task) {
  timer_->add(delay, [core = core_, task = LogSubject::carrying(std::move(task))]() mutable {
    core->submit(QueueAccess::shared, std::move(task));
  });
}

LinuxGlobalQueue::LinuxGlobalQueue(std::shared_ptr<ThreadPool> pool, std::shared_ptr<QueueTimer> timer)
    : pool_(std::move(pool)), timer_(std::move(timer)) {}

void LinuxGlobalQueue::async(QXTask task) {
  pool_->submit([task = LogSubject::carrying(std::move(task))] {
    const CurrentQueue current(&kGlobalQueue, CurrentQueue::Chain::fresh);
    task();
  });
}

void LinuxGlobalQueue::sync(const QXTask& task) {
  const CurrentQueue current(&kGlobalQueue, CurrentQueue::Chain::continued);
  task();
}

void LinuxGlobalQueue::after(std::chrono::nanoseconds delay, QXTask task) {
  timer_->add(delay, [this, task = LogSubject::carrying(std::move(task))]() mutable {
    async(std::move(task));
  });  // the timer stops before this queue goes
}

void LinuxGlobalQueue::suspend() { assert(!"the global queue cannot be suspended"); }

void LinuxGlobalQueue::resume() { assert(!"the global queue cannot be suspended"); }

bool LinuxGlobalQueue::isCurrent() const { return CurrentQueue::isCurrent(&kGlobalQueue); }

LinuxOperationQueue::LinuxOperationQueue(std::shared_ptr<ThreadPool> pool) : pool_(std::move(pool)) {}

void LinuxOperationQueue::setName(std::string name) {
  const std::lock_guard lock(mutex_);
  name_ = std::move(name);
}

std::string LinuxOperationQueue::name() const {
  const std::lock_guard lock(mutex_);
  return name_;
}

void LinuxOperationQueue::addOperation(QXTask operation) { pool_->submit(LogSubject::carrying(std::move(operation))); }

}  // namespace docuvend::linux_platform
