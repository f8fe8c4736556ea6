// Stands between this test program and the kernel's watches (--wrap in CMakeLists.txt), which other programs of the user may have used up.
#pragma once

#include <atomic>

namespace docuvend::linux_platform {

// Of every thread; one object at a time.
class WatchRefusals {
 public:
  WatchRefusals();
  WatchRefusals(const WatchRefusals&) = delete;
  WatchRefusals& operator=(const WatchRefusals&) = delete;
  ~WatchRefusals();

  std::atomic<bool> ofQueues{false};   // there is none for whoever asks
  std::atomic<bool> ofWatches{false};  // nor a watch for whoever has one
  std::atomic<int> count{0};           // how often the kernel was asked in vain
};

}  // namespace docuvend::linux_platform
