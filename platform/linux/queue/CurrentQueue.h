// Which queues the calling thread runs a task of.
//
// A thread's chain is the task it runs and, as long as each was entered by `sync`, the tasks that wait for it. A task that a thread merely
// helps with, while it waits in somebody else's `sync`, has a chain of its own: it may have been run by any thread.
#pragma once

namespace docuvend::linux_platform {

class CurrentQueue {
 public:
  enum class Chain { continued, fresh };

  // `queue` is an identity only.
  CurrentQueue(const void* queue, Chain chain);
  ~CurrentQueue();
  CurrentQueue(const CurrentQueue&) = delete;
  CurrentQueue& operator=(const CurrentQueue&) = delete;

  [[nodiscard]] static bool isCurrent(const void* queue);

 private:
  const void* const queue_;
  const CurrentQueue* const outer_;     // next in the chain
  const CurrentQueue* const previous_;  // what the thread goes back to
};

}  // namespace docuvend::linux_platform
