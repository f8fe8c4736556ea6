#include "platform/linux/queue/LinuxQueues.h"

#include <algorithm>
#include <thread>
#include <utility>

namespace docuvend::linux_platform {
namespace {

constexpr std::size_t kLeastThreadsAtOnce = 4;
constexpr std::size_t kMostThreads = 64;

PoolSize sizeForThisMachine() {
  const std::size_t atOnce = std::clamp<std::size_t>(std::thread::hardware_concurrency(), kLeastThreadsAtOnce, kMostThreads);
  return {atOnce, kMostThreads};
}

}  // namespace

LinuxQueues& LinuxQueues::processWide() {
  static LinuxQueues& service = *new LinuxQueues;
  return service;
}

LinuxQueues::LinuxQueues() : LinuxQueues(sizeForThisMachine()) {}

LinuxQueues::LinuxQueues(PoolSize size)
    : pool_(std::make_shared<ThreadPool>(size)), timer_(std::make_shared<QueueTimer>()), globalQueue_(pool_, timer_) {}

LinuxQueues::~LinuxQueues() {
  timer_->stop();
  pool_->stop();
  for (const std::weak_ptr<QueueCore>& weak : cores_) {
    if (const std::shared_ptr<QueueCore> core = weak.lock()) core->close();
  }
}

std::shared_ptr<QXQueue> LinuxQueues::serialQueue(std::string label) { return makeQueue(std::move(label), QueueKind::serial); }

std::shared_ptr<QXQueue> LinuxQueues::concurrentQueue(std::string label) { return makeQueue(std::move(label), QueueKind::concurrent); }

std::shared_ptr<QXOperationQueue> LinuxQueues::operationQueue() { return std::make_shared<LinuxOperationQueue>(pool_); }

std::shared_ptr<QXQueue> LinuxQueues::makeQueue(std::string label, QueueKind kind) {
  auto core = std::make_shared<QueueCore>(std::move(label), kind, pool_);
  const std::lock_guard lock(mutex_);
  if (cores_.size() == cores_.capacity()) {  // before the list grows
    std::erase_if(cores_, [](const std::weak_ptr<QueueCore>& weak) { return weak.expired(); });
  }
  cores_.push_back(core);
  return std::make_shared<LinuxQueue>(std::move(core), timer_);
}

}  // namespace docuvend::linux_platform
