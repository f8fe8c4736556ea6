// Stands between this test program and some of the system's calls (--wrap in CMakeLists.txt). One object is in force at a time; calls of
// every thread count, so it is made and goes while no other thread is at work.
#pragma once

#include <condition_variable>
#include <functional>
#include <mutex>
#include <string>

namespace docuvend::linux_platform::testing {

class SystemCalls {
 public:
  SystemCalls();
  SystemCalls(const SystemCalls&) = delete;
  SystemCalls& operator=(const SystemCalls&) = delete;
  ~SystemCalls();

  // Before each flush of a file, until there is another; a flush within it is not told.
  std::function<void(int descriptor)> beforeFlush;
  // Before each call that renames or makes something in a directory, or changes a file's mode; with the path of the directory or of the
  // file. From the thread that calls.
  std::function<void(const std::string& object)> beforeLocking;
};

// The kernel, while somebody writes what lies below a directory without end: calls that need its lock wait until he stops.
class LockedDirectory {
 public:
  explicit LockedDirectory(std::string path);
  LockedDirectory(const LockedDirectory&) = delete;
  LockedDirectory& operator=(const LockedDirectory&) = delete;
  ~LockedDirectory();

  // Whether so many calls wait, or come to it in a long time.
  [[nodiscard]] bool awaitWaiting(std::size_t count);
  void unlock();

 private:
  void pass(const std::string& object);

  const std::string path_;
  std::mutex mutex_;
  std::condition_variable changed_;
  std::size_t waiting_ = 0;  // guarded by mutex_, as is the next
  bool isLocked_ = true;
  SystemCalls calls_;
};

}  // namespace docuvend::linux_platform::testing
