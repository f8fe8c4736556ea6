// The linker sends every call of the listed names to __wrap_NAME, and __real_NAME is the system's own.
#include "tests/sandbox/SystemCalls.h"

#include <unistd.h>

#include <utility>

namespace docuvend::linux_platform::testing {
namespace {

SystemCalls* inForce = nullptr;

}  // namespace

SystemCalls::SystemCalls() { inForce = this; }
SystemCalls::~SystemCalls() { inForce = nullptr; }

}  // namespace docuvend::linux_platform::testing

extern "C" {
int __real_fsync(int);

int __wrap_fsync(int descriptor) {
  auto* const calls = docuvend::linux_platform::testing::inForce;
  if (calls != nullptr && calls->beforeFlush) {
    const auto told = std::exchange(calls->beforeFlush, nullptr);
    told(descriptor);
    calls->beforeFlush = told;
  }
  return __real_fsync(descriptor);
}
}
