// Everything that is submitted stands in one line. From the front of the line an entry is let in as soon as nothing inside excludes it: a
// shared entry shares with shared ones, an exclusive one (a barrier, or any task of a serial queue) is alone. Nothing ever overtakes in
// the line, so a barrier is seen by every read submitted after it. "Inside" begins when an entry is let in, not when its task starts.
//
//   line ──let in──▶ a waiting `sync`: its own thread is woken and runs its task
//             └────▶ a task: stands in `ready` until some thread takes it ──▶ runs ──▶ leaves ──▶ the next are let in
//
// Who takes a ready task. For each one, one helper is called: a thread that sleeps in `sync` on this queue if there is one (it waits for
// that very task, since everything ready stands before it), else a thread of the pool. A thread that leaves takes the next ready task
// itself, without a call. So:
//  - The invariant: there are at least as many helpers called, or at work here, as there are ready tasks, unless the queue is suspended.
//    Helpers too many find nothing and go.
//  - Progress never depends on the pool: a `sync` that has to wait first runs what is ready, and is woken for what becomes ready later.
//  With
//    every thread of the program waiting in some `sync`, follow the waits from any of them: each leads to a task that runs or that its
//    waiter takes, so only a circle of waits could stand still, and that would stand still with any number of threads.
//  - Helping nests only along such waits, so stacks stay as short as the chain of queues that wait for one another.
//
// Suspension holds back both doors: nothing is let in, and nothing ready is taken; `resume` opens them and calls for all that is ready.
//
// Costs. A `sync` that nothing excludes runs on the calling thread between two short sections under this queue's mutex, uncontended on an
// idle queue, and wakes nobody; that holds for a read of a concurrent queue too. Locks are taken in the order queue, pool; no task runs
// and none is destroyed under either.
#include "platform/linux/queue/QueueCore.h"

#include <algorithm>
#include <cassert>
#include <utility>

#include "platform/linux/queue/CurrentQueue.h"

namespace docuvend::linux_platform {
namespace {

// After so many tasks in a row a pool thread lets other queues' work come first.
constexpr int kTasksInARow = 32;

// No failure crosses a queue as an exception: one that leaves a task ends the program here.
void runTask(const QXTask& task) noexcept { task(); }

}  // namespace

QueueCore::QueueCore(std::string label, QueueKind kind, std::shared_ptr<ThreadPool> pool)
    : label_(std::move(label)), kind_(kind), pool_(std::move(pool)) {}

void QueueCore::submit(QueueAccess access, QXTask task) {
  const std::lock_guard lock(mutex_);
  if (closed_) return;  // the caller's copy is destroyed after the lock
  line_.push_back({kind_ == QueueKind::serial ? QueueAccess::exclusive : access, std::move(task), nullptr, LogSubject::current()});
  callFor(letIn());
}

void QueueCore::sync(const QXTask& task) {
  assert(!isCurrent() && "sync from a task of the queue itself");
  const QueueAccess access = kind_ == QueueKind::serial ? QueueAccess::exclusive : QueueAccess::shared;
  std::unique_lock lock(mutex_);
  if (suspended_ == 0 && line_.empty() && admits(access)) {
    enter(access);
  } else {
    Waiter waiter;
    line_.push_back({access, {}, &waiter, {}});
    while (!waiter.isInside) waitOrHelp(lock, waiter);
  }
  lock.unlock();
  {
    const CurrentQueue current(this, CurrentQueue::Chain::continued);
    runTask(task);
  }
  lock.lock();
  callFor(leave(access));
}

void QueueCore::suspend() {
  const std::lock_guard lock(mutex_);
  ++suspended_;
}

void QueueCore::resume() {
  const std::lock_guard lock(mutex_);
  assert(suspended_ > 0 && "one resume too many");
  if (--suspended_ > 0) return;
  (void)letIn();
  callFor(ready_.size());
}

bool QueueCore::isCurrent() const { return CurrentQueue::isCurrent(this); }

void QueueCore::close() {
  std::deque<Entry> never;
  const std::lock_guard lock(mutex_);
  closed_ = true;
  never.swap(ready_);
  for (const Entry& entry : never) --(entry.access == QueueAccess::shared ? insideShared_ : insideExclusive_);
  for (Entry& entry : line_) {
    if (entry.waiter == nullptr) never.push_back(std::move(entry));
  }
  std::erase_if(line_, [](const Entry& entry) { return entry.waiter == nullptr; });
  (void)letIn();  // only waiters are left
}

bool QueueCore::admits(QueueAccess access) const { return insideExclusive_ == 0 && (access == QueueAccess::shared || insideShared_ == 0); }

void QueueCore::enter(QueueAccess access) { ++(access == QueueAccess::shared ? insideShared_ : insideExclusive_); }

std::size_t QueueCore::leave(QueueAccess access) {
  --(access == QueueAccess::shared ? insideShared_ : insideExclusive_);
  return letIn();
}

// Says how many tasks became ready; the caller sees to it that they are taken.
std::size_t QueueCore::letIn() {
  std::size_t tasks = 0;
  while (suspended_ == 0 && !line_.empty() && admits(line_.front().access)) {
    Entry entry = std::move(line_.front());
    line_.pop_front();
    enter(entry.access);
    if (entry.waiter != nullptr) {
      entry.waiter->isInside = true;
      std::erase(sleepers_, entry.waiter);
      entry.waiter->wake.notify_one();
    } else {
      ready_.push_back(std::move(entry));
      ++tasks;
    }
  }
  return tasks;
}

std::optional<QueueCore::Entry> QueueCore::takeReady() {
  if (suspended_ > 0 || ready_.empty()) return std::nullopt;
  std::optional<Entry> entry = std::move(ready_.front());
  ready_.pop_front();
  return entry;
}

// Runs without the lock. Says how many tasks became ready.
std::size_t QueueCore::runReady(std::unique_lock<std::mutex>& lock, Entry entry) {
  lock.unlock();
  {
    const CurrentQueue current(this, CurrentQueue::Chain::fresh);
    const LogSubject subject(std::move(entry.subject));  // not that of a thread that helps
    runTask(entry.task);
    entry.task = {};  // what the task held is released as part of the task
  }
  lock.lock();
  return leave(entry.access);
}

void QueueCore::callFor(std::size_t tasks) {
  for (; tasks > 0 && !sleepers_.empty(); --tasks) {
    Waiter* const sleeper = sleepers_.back();
    sleepers_.pop_back();
    sleeper->mayHelp = true;
    sleeper->wake.notify_one();
  }
  for (; tasks > 0; --tasks) pool_->submit([core = shared_from_this()] { core->help(); });
}

void QueueCore::waitOrHelp(std::unique_lock<std::mutex>& lock, Waiter& waiter) {
  if (std::optional<Entry> entry = takeReady()) {
    const std::size_t tasks = runReady(lock, std::move(*entry));
    // This thread comes back for one of them, unless its own turn has come.
    callFor(waiter.isInside || tasks == 0 ? tasks : tasks - 1);
    return;
  }
  sleepers_.push_back(&waiter);
  waiter.mayHelp = false;
  const ThreadPool::Blocked blocked(*pool_);
  waiter.wake.wait(lock, [&waiter] { return waiter.isInside || waiter.mayHelp; });
}

void QueueCore::help() {
  std::unique_lock lock(mutex_);
  for (int run = 0; run < kTasksInARow; ++run) {
    std::optional<Entry> entry = takeReady();
    if (!entry) return;
    const std::size_t tasks = runReady(lock, std::move(*entry));
    if (tasks > 1) callFor(tasks - 1);
  }
  if (!ready_.empty()) callFor(1);
}

}  // namespace docuvend::linux_platform
