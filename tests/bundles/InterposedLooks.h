// Stands between this test program and what the kernel says of files (--wrap in CMakeLists.txt), which it may not be able to say: there are
// no descriptors left, no memory, or the disk does not read.
#pragma once

#include <atomic>
#include <functional>
#include <mutex>
#include <string>

namespace docuvend::linux_platform {

// Of every thread; one object at a time, which outlives what looks at files.
class InterposedLooks {
 public:
  struct Call {
    std::string name;  // of the function
    std::string path;  // as it was given; empty where none was
  };

  InterposedLooks();
  InterposedLooks(const InterposedLooks&) = delete;
  InterposedLooks& operator=(const InterposedLooks&) = delete;
  ~InterposedLooks();

  // Called before each call is made; what it gives is the error that the call fails with, 0 when it is made. Not to be called from there.
  void failWith(std::function<int(const Call&)> errorOf);
  // The call of that function with that path fails until the next failWith.
  void failAt(const std::string& name, const std::string& path, int error);
  // From now on the kernel does not say of what kind the entries of a directory are, as some file systems do not.
  void hideKinds() { areKindsHidden_ = true; }

 private:
  friend struct InterposedLookCalls;

  std::atomic<bool> areKindsHidden_{false};
  std::mutex mutex_;
  std::function<int(const Call&)> errorOf_;  // guarded by mutex_, also while it runs
};

}  // namespace docuvend::linux_platform
