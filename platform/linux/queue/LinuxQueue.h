// The handles that callers hold: of a serial or concurrent queue, of the global queue, of an operation queue.
#pragma once

#include <memory>
#include <mutex>
#include <string>

#include "platform/linux/queue/QueueCore.h"
#include "platform/linux/queue/QueueTimer.h"
#include "platform/linux/queue/ThreadPool.h"
#include "platform/queue.h"

namespace docuvend::linux_platform {

class LinuxQueue final : public QXQueue {
 public:
  LinuxQueue(std::shared_ptr<QueueCore> core, std::shared_ptr<QueueTimer> timer);

  [[nodiscard]] const std::string& label() const override { return core_->label(); }
  void async(QXTask task) override { core_->submit(QueueAccess::shared, std::move(task)); }
  void sync(const QXTask& task) override;
  void barrierAsync(QXTask task) override { core_->submit(QueueAccess::exclusive, std::move(task)); }
  void after(std::chrono::nanoseconds delay, QXTask task) override;
  void suspend() override { core_->suspend(); }
  void resume() override { core_->resume(); }
  [[nodiscard]] bool isCurrent() const override { return core_->isCurrent(); }

 private:
  const std::shared_ptr<QueueCore> core_;
  const std::shared_ptr<QueueTimer> timer_;
};

// Guards nothing: tasks go straight to the pool, `sync` runs at once on the calling thread, a barrier is a task like any other.
class LinuxGlobalQueue final : public QXQueue {
 public:
  LinuxGlobalQueue(std::shared_ptr<ThreadPool> pool, std::shared_ptr<QueueTimer> timer);

  [[nodiscard]] const std::string& label() const override { return label_; }
  void async(QXTask task) override;
  void sync(const QXTask& task) override;
  void barrierAsync(QXTask task) override { async(std::move(task)); }
  void after(std::chrono::nanoseconds delay, QXTask task) override;
  void suspend() override;
  void resume() override;
  [[nodiscard]] bool isCurrent() const override;

 private:
  const std::string label_ = "global queue";
  const std::shared_ptr<ThreadPool> pool_;
  const std::shared_ptr<QueueTimer> timer_;
};

class LinuxOperationQueue final : public QXOperationQueue {
 public:
  explicit LinuxOperationQueue(std::shared_ptr<ThreadPool> pool);

  void setName(std::string name) override;
  [[nodiscard]] std::string name() const override;
  void addOperation(QXTask operation) override;

 private:
  const std::shared_ptr<ThreadPool> pool_;
  mutable std::mutex mutex_;
  std::string name_;  // guarded by mutex_
};

}  // namespace docuvend::linux_platform
