// The linker sends every call of the listed names to __wrap_NAME, and __real_NAME is the system's own.
#include "tests/bundles/InterposedWatches.h"

#include <cerrno>
#include <cstdint>
#include <utility>

namespace docuvend::linux_platform {
namespace {

std::atomic<InterposedWatches*> inForce{nullptr};

}  // namespace

InterposedWatches::InterposedWatches() { inForce = this; }
InterposedWatches::~InterposedWatches() { inForce = nullptr; }

void InterposedWatches::beforeEach(std::function<void(const std::string&)> call) {
  const std::lock_guard lock(mutex_);
  before_ = std::move(call);
}

struct InterposedCalls {
  static bool isRefused(std::atomic<bool> InterposedWatches::*what) {
    auto* const watches = inForce.load();
    if (watches == nullptr || !(watches->*what)) return false;
    ++watches->refused;
    return true;
  }

  static void tellBefore(const std::string& path) {
    auto* const watches = inForce.load();
    if (watches == nullptr) return;
    const std::lock_guard lock(watches->mutex_);
    if (watches->before_) watches->before_(path);
  }
};

}  // namespace docuvend::linux_platform

using docuvend::linux_platform::InterposedCalls;
using docuvend::linux_platform::InterposedWatches;

extern "C" {
int __real_inotify_init1(int);
int __real_inotify_add_watch(int, const char*, std::uint32_t);

int __wrap_inotify_init1(int flags) {
  if (!InterposedCalls::isRefused(&InterposedWatches::refusesQueues)) return __real_inotify_init1(flags);
  errno = EMFILE;
  return -1;
}

int __wrap_inotify_add_watch(int queue, const char* path, std::uint32_t mask) {
  InterposedCalls::tellBefore(path);
  if (!InterposedCalls::isRefused(&InterposedWatches::refusesWatches)) return __real_inotify_add_watch(queue, path, mask);
  errno = ENOSPC;
  return -1;
}
}
