// The queue service on Linux: serial and concurrent queues, the global queue and operation queues over one thread pool, delayed submission
// over one timer thread, the main run loop. No thread begins before there is work for it.
#pragma once

#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/linux/queue/LinuxQueue.h"
#include "platform/linux/queue/LinuxRunLoop.h"
#include "platform/linux/queue/QueueTimer.h"
#include "platform/linux/queue/ThreadPool.h"
#include "platform/queue.h"

namespace docuvend::linux_platform {

class LinuxQueues final : public QXQueueService {
 public:
  // A program's one service. It is never destroyed, so work may be submitted until the process is gone, by destructors of static objects
  // too; what has not run by then never does.
  [[nodiscard]] static LinuxQueues& processWide();

  // As many pool threads at once as processors, and a few at least, since tasks wait for disks.
  LinuxQueues();
  explicit LinuxQueues(PoolSize size);
  // Waits for the tasks that run, and destroys those that have not begun. Queues that are still held afterwards destroy what is submitted.
  // Not to be called from a task.
  ~LinuxQueues() override;

  [[nodiscard]] std::shared_ptr<QXQueue> serialQueue(std::string label) override;
  [[nodiscard]] std::shared_ptr<QXQueue> concurrentQueue(std::string label) override;
  [[nodiscard]] QXQueue& globalQueue() override { return globalQueue_; }
  [[nodiscard]] std::shared_ptr<QXOperationQueue> operationQueue() override;
  [[nodiscard]] LinuxRunLoop& mainRunLoop() override { return mainRunLoop_; }

  // For measurements: how often the pool woke or began a thread.
  [[nodiscard]] std::size_t wakeUps() const { return pool_->wakeUps(); }

 private:
  [[nodiscard]] std::shared_ptr<QXQueue> makeQueue(std::string label, QueueKind kind);

  const std::shared_ptr<ThreadPool> pool_;
  const std::shared_ptr<QueueTimer> timer_;
  LinuxGlobalQueue globalQueue_;
  LinuxRunLoop mainRunLoop_;
  std::mutex mutex_;
  std::vector<std::weak_ptr<QueueCore>> cores_;  // guarded by mutex_
};

}  // namespace docuvend::linux_platform
