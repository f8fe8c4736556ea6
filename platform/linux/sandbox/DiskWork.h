// Work that waits for the disk or for a directory, on threads of its own: a disk takes as long as what was written to it asks for, a
// directory is locked for as long as somebody writes a file that is being replaced in it, and those who serve requests must not wait with
// either.
//
// Who stands in line in one directory stands there for all of it. So of the threads an owner has one, and a directory has a part: others
// find room however many owners want something in one that is locked.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

namespace docuvend::linux_platform {

// All operations may be called from any thread.
class DiskWork {
 public:
  // So many owners' work runs at once; fewer when the system has no more threads to give.
  static constexpr std::size_t kMostThreads = 32;
  // And so many owners' in one directory.
  static constexpr std::size_t kMostThreadsOfDirectory = 8;

  // std::system_error when the system has no thread at all.
  DiskWork();
  // Lets the work that runs end and drops the rest.
  ~DiskWork();
  DiskWork(const DiskWork&) = delete;
  DiskWork& operator=(const DiskWork&) = delete;

  // An owner's work runs one after another, in its order; owners take turns, but for those whose next work is in a directory that has all
  // the threads it may have. How much may wait is for the caller to limit.
  void submit(const std::string& owner, std::string directory, std::function<void()> work);

 private:
  struct Work {
    std::string directory;
    std::function<void()> run;
  };
  using Line = std::deque<Work>;

  void run();
  // With the lock held: takes the next owner whose work may run out of those who wait.
  [[nodiscard]] std::optional<std::string> takeNextOwner();

  std::mutex mutex_;  // guards what follows
  std::condition_variable changed_;
  std::map<std::string, Line> lines_;           // of the owners who have work, waiting or running
  std::deque<std::string> waiting_;             // those of whom none runs, the next one first
  std::map<std::string, std::size_t> running_;  // how many run in a directory
  bool stopping_ = false;
  std::vector<std::thread> threads_;  // the last of them, since they use the others
};

}  // namespace docuvend::linux_platform
