// The linker sends every call of the listed names to __wrap_NAME, and __real_NAME is the system's own.
#include "tests/sandbox/SystemCalls.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdarg>
#include <utility>

#include "platform/linux/sandbox/Resolution.h"

namespace docuvend::linux_platform::testing {
namespace {

constexpr std::chrono::seconds kPatience{60};

SystemCalls* inForce = nullptr;

void tellOfLocking(int object) {
  if (inForce != nullptr && inForce->beforeLocking) inForce->beforeLocking(kernelPath(object).value_or(""));
}

}  // namespace

SystemCalls::SystemCalls() { inForce = this; }
SystemCalls::~SystemCalls() { inForce = nullptr; }

LockedDirectory::LockedDirectory(std::string path) : path_(std::move(path)) {
  calls_.beforeLocking = [this](const std::string& object) { pass(object); };
}

void LockedDirectory::pass(const std::string& object) {
  if (object != path_ && !liesBelow(path_, object)) return;
  std::unique_lock lock(mutex_);
  if (!isLocked_) return;
  ++waiting_;
  changed_.notify_all();
  changed_.wait_for(lock, kPatience, [this] { return !isLocked_; });
  --waiting_;
  changed_.notify_all();
}

LockedDirectory::~LockedDirectory() {
  unlock();
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [this] { return waiting_ == 0; });
}

bool LockedDirectory::awaitWaiting(std::size_t count) {
  std::unique_lock lock(mutex_);
  return changed_.wait_for(lock, kPatience, [this, count] { return waiting_ >= count; });
}

void LockedDirectory::unlock() {
  const std::lock_guard lock(mutex_);
  isLocked_ = false;
  changed_.notify_all();
}

}  // namespace docuvend::linux_platform::testing

using docuvend::linux_platform::UniqueDescriptor;
using docuvend::linux_platform::testing::inForce;
using docuvend::linux_platform::testing::tellOfLocking;

extern "C" {
int __real_fsync(int);
int __real_renameat(int, const char*, int, const char*);
int __real_openat(int, const char*, int, ...);
int __real_chmod(const char*, mode_t);
int __real_fchmod(int, mode_t);

int __wrap_fsync(int descriptor) {
  auto* const calls = inForce;
  if (calls != nullptr && calls->beforeFlush) {
    const auto told = std::exchange(calls->beforeFlush, nullptr);
    told(descriptor);
    calls->beforeFlush = told;
  }
  return __real_fsync(descriptor);
}

int __wrap_renameat(int from, const char* name, int to, const char* newName) {
  tellOfLocking(to);
  return __real_renameat(from, name, to, newName);
}

int __wrap_openat(int directory, const char* name, int flags, ...) {
  if ((flags & O_CREAT) == 0) return __real_openat(directory, name, flags);
  std::va_list arguments;
  va_start(arguments, flags);
  const auto mode = va_arg(arguments, mode_t);
  va_end(arguments);
  tellOfLocking(directory);
  return __real_openat(directory, name, flags, mode);
}

int __wrap_chmod(const char* path, mode_t mode) {
  if (inForce != nullptr) tellOfLocking(UniqueDescriptor(::open(path, O_PATH | O_CLOEXEC)).get());
  return __real_chmod(path, mode);
}

int __wrap_fchmod(int file, mode_t mode) {
  tellOfLocking(file);
  return __real_fchmod(file, mode);
}
}
