// Queues that are turned by hand, on one thread. Nothing that is submitted runs before the test turns it.
//
// Where it differs from a real adapter:
//  - One thread: every call must come from the thread that made the service, and no two tasks overlap. Tasks of all queues start in the
//    order of their submission; where the contract promises no order (operations, readers, different queues) this is only one of the
//    possible orders.
//  - `sync` runs all tasks that stand before it on that queue, readers too, then its own, all inside the call. Where a real `sync` would
//    wait for somebody else (the queue is suspended) the fake turns other queues until it can go on; where it would wait for ever the
//    program is aborted with one line that says why.
//  - Time stands still but for `advance`. A task whose time has come is submitted, not run.
//  - `QXRunLoop::run` returns at once and runs nothing; what was given to `perform` is turned like every other task.
//  - `suspend` and `resume` are checked in release builds too.
//  - When the service is destroyed the tasks it still holds are destroyed, and tasks submitted later are destroyed at once.
#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

#include "platform/queue.h"

namespace docuvend::fake_platform {

inline constexpr const char* kFakeGlobalQueueLabel = "global queue";
inline constexpr const char* kFakeMainRunLoopLabel = "main run loop";

enum class FakeQueueKind { serial, concurrent };

// A queue as it was asked for.
struct FakeCreatedQueue {
  FakeQueueKind kind;
  std::string label;

  friend bool operator==(const FakeCreatedQueue&, const FakeCreatedQueue&) = default;
  friend std::ostream& operator<<(std::ostream& stream, const FakeCreatedQueue& queue) {
    return stream << (queue.kind == FakeQueueKind::serial ? "serial: " : "concurrent: ") << queue.label;
  }
};

class FakeQueues final : public QXQueueService {
 public:
  FakeQueues();
  ~FakeQueues() override;

  [[nodiscard]] std::shared_ptr<QXQueue> serialQueue(std::string label) override;
  [[nodiscard]] std::shared_ptr<QXQueue> concurrentQueue(std::string label) override;
  [[nodiscard]] QXQueue& globalQueue() override;
  [[nodiscard]] std::shared_ptr<QXOperationQueue> operationQueue() override;
  [[nodiscard]] QXRunLoop& mainRunLoop() override;

  // Runs the oldest task that may run now, of all queues or of the queues with that label. False when there was none.
  bool runOne();
  bool runOne(std::string_view label);
  // Runs until nothing may run; says how many tasks ran. Aborts when there is no end in sight.
  std::size_t runAll();
  // Moves the clock and submits what is due, in the order of the due times.
  void advance(std::chrono::nanoseconds duration);

  // Tasks submitted and not yet started: of all queues, or of those with that label or operation queue name. Tasks of `after` whose time
  // has not come are not among them.
  [[nodiscard]] std::size_t pending() const;
  [[nodiscard]] std::size_t pending(std::string_view label) const;
  [[nodiscard]] std::size_t pendingOnGlobalQueue() const { return pending(kFakeGlobalQueueLabel); }
  [[nodiscard]] std::size_t pendingOnMainRunLoop() const { return pending(kFakeMainRunLoopLabel); }
  [[nodiscard]] std::size_t pendingOperations() const;
  // Tasks of `after` whose time has not come.
  [[nodiscard]] std::size_t pendingTimers() const;
  // How many `resume` calls the queues with that label wait for.
  [[nodiscard]] std::size_t suspendedCount(std::string_view label) const;

  // The serial and concurrent queues in the order of their creation, released ones too.
  [[nodiscard]] std::vector<FakeCreatedQueue> createdQueues() const;
  // The label (or operation queue name) of the innermost running task; empty outside of tasks.
  [[nodiscard]] std::string currentLabel() const;
  // How often the main run loop's `run` was called.
  [[nodiscard]] std::size_t runLoopRuns() const;

 private:
  class Core;
  class Queue;
  class Operations;
  class RunLoop;

  std::shared_ptr<Core> core_;  // queues that outlive the service hold it too
  std::unique_ptr<Queue> globalQueue_;
  std::unique_ptr<RunLoop> mainRunLoop_;
};

}  // namespace docuvend::fake_platform
