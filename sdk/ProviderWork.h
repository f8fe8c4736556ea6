// The threads on which a provider's operations run.
//
// Two kinds of work, so that downloads without number leave the quick answers their threads; and work with a key, of which one piece runs
// at a time for each key, in order.
#pragma once

#include <chrono>
#include <condition_variable>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace docuvend {

// Up to a number of threads, made when work finds all others busy.
class WorkerThreads {
 public:
  explicit WorkerThreads(std::size_t limit) : limit_(limit) {}
  // `finish` has returned true.
  ~WorkerThreads();
  WorkerThreads(const WorkerThreads&) = delete;
  WorkerThreads& operator=(const WorkerThreads&) = delete;

  // Work that comes after `finish` is dropped.
  void perform(std::function<void()> work);
  // Drops the work that has not begun and waits for the rest. False: some is still running after that time.
  [[nodiscard]] bool finish(std::chrono::milliseconds patience);

 private:
  void run();
  void addThread();

  const std::size_t limit_;
  std::mutex mutex_;  // guards all below
  std::condition_variable changed_;
  std::deque<std::function<void()>> waiting_;
  std::vector<std::thread> threads_;
  std::size_t idle_ = 0;
  std::size_t running_ = 0;
  bool isFinished_ = false;
};

class ProviderWork {
 public:
  // Work that is to be done soon.
  void performQuick(std::function<void()> work) { quick_.perform(std::move(work)); }
  // Work that may take long.
  void performForItem(const std::string& key, std::function<void()> work);
  // Ends both kinds. False: some is still running after that time, and must not lose what it uses.
  [[nodiscard]] bool finish(std::chrono::milliseconds patience);

 private:
  void runNext(const std::string& key);

  static constexpr std::size_t kQuickThreads = 4;
  static constexpr std::size_t kLongThreads = 16;

  std::mutex mutex_;  // guards the queues
  // Of keys with work that runs or waits for a thread: the work behind it.
  std::map<std::string, std::deque<std::function<void()>>> queues_;
  WorkerThreads quick_{kQuickThreads};
  WorkerThreads long_{kLongThreads};
};

}  // namespace docuvend
