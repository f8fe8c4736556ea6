// What a serial or concurrent queue is, apart from its handle: the handle may be released while work is left, the core lives on with it.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/base/LogSubject.h"
#include "platform/linux/queue/ThreadPool.h"
#include "platform/queue.h"

namespace docuvend::linux_platform {

enum class QueueKind { serial, concurrent };
enum class QueueAccess { shared, exclusive };  // on a serial queue every access is exclusive

// All operations may be called from any thread; tasks run on threads of the pool or of callers of `sync`.
class QueueCore : public std::enable_shared_from_this<QueueCore> {
 public:
  QueueCore(std::string label, QueueKind kind, std::shared_ptr<ThreadPool> pool);

  [[nodiscard]] const std::string& label() const { return label_; }
  void submit(QueueAccess access, QXTask task);
  void sync(const QXTask& task);
  void suspend();
  void resume();
  [[nodiscard]] bool isCurrent() const;

  // Destroys the tasks that have not begun, and from now on every submitted task at once; `sync` still works. For the service's end, when
  // the pool has stopped.
  void close();

 private:
  struct Waiter {
    std::condition_variable wake;
    bool isInside = false;  // its turn has come
    bool mayHelp = false;   // woken to run a ready task
  };
  struct Entry {
    QueueAccess access;
    QXTask task;     // empty for a waiter
    Waiter* waiter;  // lives on the stack of its `sync`
    LogSubject::Name subject;
  };

  [[nodiscard]] bool admits(QueueAccess access) const;
  void enter(QueueAccess access);
  [[nodiscard]] std::size_t leave(QueueAccess access);
  [[nodiscard]] std::size_t letIn();
  [[nodiscard]] std::optional<Entry> takeReady();
  [[nodiscard]] std::size_t runReady(std::unique_lock<std::mutex>& lock, Entry entry);
  void callFor(std::size_t tasks);
  void waitOrHelp(std::unique_lock<std::mutex>& lock, Waiter& waiter);
  void help();

  const std::string label_;
  const QueueKind kind_;
  const std::shared_ptr<ThreadPool> pool_;

  std::mutex mutex_;  // guards what follows
  std::deque<Entry> line_;
  std::deque<Entry> ready_;
  std::vector<Waiter*> sleepers_;
  std::size_t insideShared_ = 0;
  std::size_t insideExclusive_ = 0;
  std::size_t suspended_ = 0;
  bool closed_ = false;
};

}  // namespace docuvend::linux_platform
