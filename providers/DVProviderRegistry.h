// What the process knows of its providers: the state behind the class side of DVExtensionDocuvend, and the queues that guard it.
#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <mutex>
#include <utility>

#include "platform/extension_host.h"
#include "platform/identifiers.h"
#include "platform/queue.h"
#include "providers/DVExtensionDocuvend.h"

namespace docuvend {

class DVProviderRegistry {
 public:
  using Dictionary = std::map<ProviderID, std::shared_ptr<DVExtensionDocuvend>>;

  // Created on first use, never destroyed.
  [[nodiscard]] static DVProviderRegistry& shared();

  DVProviderRegistry(const DVProviderRegistry&) = delete;
  DVProviderRegistry& operator=(const DVProviderRegistry&) = delete;

  [[nodiscard]] QXQueue& concurrentQueue() const { return *concurrentQueue_; }
  // Every refresh pass starts here; the queue is suspended until the pass has ended.
  [[nodiscard]] QXQueue& refreshOperationsQueue() const { return *refreshOperationsQueue_; }

  // Only on concurrentQueue: read by synchronous tasks, changed by barriers.
  [[nodiscard]] const Dictionary& concurrentQueueProviders() const;
  void concurrentQueueSetProviders(Dictionary providers);

  // Runs `start` unless discovery was started before. True when it ran.
  template <class Start>
  bool startDiscoveryOnce(const Start& start) {
    bool started = false;
    std::call_once(discoveryStarted_, [&started, &start] {
      started = true;
      start();
    });
    return started;
  }

  // Set while discovery is started, so before there is a pass; the first pass that ends takes it, and every later one takes an empty one.
  // Two passes may take at once, because a pass resumes the queue before it takes and the next one may then run to its end.
  void setPendingStartUpCompletion(DVExtensionDocuvend::Completion completion) { pendingStartUpCompletion_ = std::move(completion); }
  [[nodiscard]] DVExtensionDocuvend::Completion takePendingStartUpCompletion();

  // Kept for good; set once, while discovery is started.
  void setMatch(std::unique_ptr<QXExtensionMatch> match) { match_ = std::move(match); }

 private:
  DVProviderRegistry();

  // Fixed after construction
  const std::shared_ptr<QXQueue> concurrentQueue_;
  const std::shared_ptr<QXQueue> refreshOperationsQueue_;

  // Only on concurrentQueue_
  Dictionary concurrentQueueProviders_;

  // Written while discovery is started; the completion is then touched by whoever sets the flag beside it, and by nobody else: the passes
  // exclude one another only until they resume the queue
  std::once_flag discoveryStarted_;
  std::unique_ptr<QXExtensionMatch> match_;
  DVExtensionDocuvend::Completion pendingStartUpCompletion_;
  std::atomic_flag startUpCompletionTaken_;
};

}  // namespace docuvend
