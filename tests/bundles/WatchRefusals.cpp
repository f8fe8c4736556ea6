// The linker sends every call of the listed names to __wrap_NAME, and __real_NAME is the system's own.
#include "tests/bundles/WatchRefusals.h"

#include <cerrno>
#include <cstdint>

namespace docuvend::linux_platform {
namespace {

std::atomic<WatchRefusals*> inForce{nullptr};

bool refuses(std::atomic<bool> WatchRefusals::*what) {
  auto* const refusals = inForce.load();
  if (refusals == nullptr || !(refusals->*what)) return false;
  ++refusals->count;
  return true;
}

}  // namespace

WatchRefusals::WatchRefusals() { inForce = this; }
WatchRefusals::~WatchRefusals() { inForce = nullptr; }

}  // namespace docuvend::linux_platform

using docuvend::linux_platform::refuses;
using docuvend::linux_platform::WatchRefusals;

extern "C" {
int __real_inotify_init1(int);
int __real_inotify_add_watch(int, const char*, std::uint32_t);

int __wrap_inotify_init1(int flags) {
  if (!refuses(&WatchRefusals::ofQueues)) return __real_inotify_init1(flags);
  errno = EMFILE;
  return -1;
}

int __wrap_inotify_add_watch(int queue, const char* path, std::uint32_t mask) {
  if (!refuses(&WatchRefusals::ofWatches)) return __real_inotify_add_watch(queue, path, mask);
  errno = ENOSPC;
  return -1;
}
}
