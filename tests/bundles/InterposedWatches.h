// Stands between this test program and the kernel's watches (--wrap in CMakeLists.txt), which other programs of the user may have used up,
// and which come late when the machine has other things to do.
#pragma once

#include <atomic>
#include <functional>
#include <mutex>
#include <string>

namespace docuvend::linux_platform {

// Of every thread; one object at a time, which outlives what asks for watches.
class InterposedWatches {
 public:
  InterposedWatches();
  InterposedWatches(const InterposedWatches&) = delete;
  InterposedWatches& operator=(const InterposedWatches&) = delete;
  ~InterposedWatches();

  // Called with a directory's path before the kernel is asked to watch it. Not to be called from such a call.
  void beforeEach(std::function<void(const std::string&)> call);

  std::atomic<bool> refusesQueues{false};   // there is none for whoever asks
  std::atomic<bool> refusesWatches{false};  // nor a watch for whoever has one
  std::atomic<int> refused{0};              // how often the kernel was asked in vain

 private:
  friend struct InterposedCalls;

  std::mutex mutex_;
  std::function<void(const std::string&)> before_;  // guarded by mutex_, also while it runs
};

}  // namespace docuvend::linux_platform
