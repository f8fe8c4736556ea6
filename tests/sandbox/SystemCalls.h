// Stands between this test program and one of the system's calls (--wrap in CMakeLists.txt). One object is in force at a time; calls of
// every thread count, so it is made and goes while no other thread is at work.
#pragma once

#include <functional>

namespace docuvend::linux_platform::testing {

class SystemCalls {
 public:
  SystemCalls();
  SystemCalls(const SystemCalls&) = delete;
  SystemCalls& operator=(const SystemCalls&) = delete;
  ~SystemCalls();

  // Before each flush of a file, until there is another; a flush within it is not told.
  std::function<void(int descriptor)> beforeFlush;
};

}  // namespace docuvend::linux_platform::testing
