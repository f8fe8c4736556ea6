// Queues: where the program's work runs and what guards its state.
//
// What callers rely on, whichever platform is installed:
//  - Tasks of a serial queue run one at a time in the order of their submission.
//  - Tasks of a concurrent queue overlap; a barrier task runs alone, after everything submitted before it and before everything
//    submitted after it. So a barrier submitted before a `sync` from the same thread is seen by that `sync`.
//  - `suspend` takes effect when the running task has ended; each `suspend` needs one `resume`, and one too many is caught by an assertion.
//  - `sync` returns when its task has run. It never starves anybody: with every thread of the program blocked in `sync`, the work
//    that they wait for still runs. `sync` on a queue from a task of that same queue is caught by an assertion.
//  - Tasks may be submitted from anywhere at any time, also while the process ends. A task that is never run is destroyed.
//  - A queue may be released while it holds work: the work submitted to it still runs.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <type_traits>
#include <utility>

namespace docuvend {

using QXTask = std::function<void()>;

class QXQueue {
 public:
  QXQueue() = default;
  QXQueue(const QXQueue&) = delete;
  QXQueue& operator=(const QXQueue&) = delete;
  virtual ~QXQueue() = default;

  [[nodiscard]] virtual const std::string& label() const = 0;

  virtual void async(QXTask task) = 0;
  virtual void sync(const QXTask& task) = 0;
  // On a serial queue the same as `async`.
  virtual void barrierAsync(QXTask task) = 0;
  // Submits the task that much later.
  virtual void after(std::chrono::nanoseconds delay, QXTask task) = 0;

  // Serial and concurrent queues only, not the global one.
  virtual void suspend() = 0;
  virtual void resume() = 0;

  // True inside a task of this queue, on the thread that runs it.
  [[nodiscard]] virtual bool isCurrent() const = 0;
};

// Runs `body` as a synchronous task and hands its result back.
template <class Body>
[[nodiscard]] auto qxSync(QXQueue& queue, const Body& body) -> std::invoke_result_t<Body> {
  std::optional<std::invoke_result_t<Body>> result;
  queue.sync([&result, &body] { result.emplace(body()); });
  return std::move(*result);
}

// Runs operations on threads of its own choosing, several at once: nothing about their order is promised.
class QXOperationQueue {
 public:
  QXOperationQueue() = default;
  QXOperationQueue(const QXOperationQueue&) = delete;
  QXOperationQueue& operator=(const QXOperationQueue&) = delete;
  virtual ~QXOperationQueue() = default;

  virtual void setName(std::string name) = 0;
  [[nodiscard]] virtual std::string name() const = 0;
  virtual void addOperation(QXTask operation) = 0;
};

// The main thread's loop.
class QXRunLoop {
 public:
  QXRunLoop() = default;
  QXRunLoop(const QXRunLoop&) = delete;
  QXRunLoop& operator=(const QXRunLoop&) = delete;
  virtual ~QXRunLoop() = default;

  // Runs what is given to `perform`, in order, on the calling (main) thread; does not return in normal operation.
  virtual void run() = 0;
  // May be called from any thread, also before `run`.
  virtual void perform(QXTask task) = 0;
};

class QXQueueService {
 public:
  QXQueueService() = default;
  QXQueueService(const QXQueueService&) = delete;
  QXQueueService& operator=(const QXQueueService&) = delete;
  virtual ~QXQueueService() = default;

  [[nodiscard]] virtual std::shared_ptr<QXQueue> serialQueue(std::string label) = 0;
  [[nodiscard]] virtual std::shared_ptr<QXQueue> concurrentQueue(std::string label) = 0;
  // The global concurrent queue of default priority; it outlives everything.
  [[nodiscard]] virtual QXQueue& globalQueue() = 0;
  [[nodiscard]] virtual std::shared_ptr<QXOperationQueue> operationQueue() = 0;
  [[nodiscard]] virtual QXRunLoop& mainRunLoop() = 0;
};

}  // namespace docuvend
