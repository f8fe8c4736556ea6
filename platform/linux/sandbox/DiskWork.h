// Work that waits for the disk, on threads of its own: a disk takes as long as what was written to it asks for, and those who serve
// requests must not wait with it.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace docuvend::linux_platform {

// All operations may be called from any thread.
class DiskWork {
 public:
  // So many owners' work runs at once; fewer when the system has no more threads to give.
  static constexpr std::size_t kMostThreads = 4;

  // std::system_error when the system has no thread at all.
  DiskWork();
  // Lets the work that runs end and drops the rest.
  ~DiskWork();
  DiskWork(const DiskWork&) = delete;
  DiskWork& operator=(const DiskWork&) = delete;

  // An owner's work runs one after another, in its order; owners take turns. How much may wait is for the caller to limit.
  void submit(const std::string& owner, std::function<void()> work);

 private:
  using Line = std::deque<std::function<void()>>;

  void run();

  std::mutex mutex_;  // guards what follows
  std::condition_variable changed_;
  std::map<std::string, Line> lines_;  // of the owners who have work, waiting or running
  std::deque<std::string> waiting_;    // those of whom none runs, the next one first
  bool stopping_ = false;
  std::vector<std::thread> threads_;  // the last of them, since they use the others
};

}  // namespace docuvend::linux_platform
