// The linker sends every call of the listed names to __wrap_NAME, and __real_NAME is the system's own.
#include "tests/bundles/InterposedLooks.h"

#include <dirent.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/types.h>

#include <atomic>
#include <cerrno>
#include <cstddef>
#include <utility>

namespace docuvend::linux_platform {
namespace {

std::atomic<InterposedLooks*> inForce{nullptr};

}  // namespace

InterposedLooks::InterposedLooks() { inForce = this; }
InterposedLooks::~InterposedLooks() { inForce = nullptr; }

void InterposedLooks::failWith(std::function<int(const Call&)> errorOf) {
  const std::lock_guard lock(mutex_);
  errorOf_ = std::move(errorOf);
}

void InterposedLooks::failAt(const std::string& name, const std::string& path, int error) {
  failWith([name, path, error](const Call& call) { return call.name == name && call.path == path ? error : 0; });
}

struct InterposedLookCalls {
  static bool areKindsHidden() {
    auto* const looks = inForce.load();
    return looks != nullptr && looks->areKindsHidden_;
  }

  static bool fails(const char* name, const char* path) {
    auto* const looks = inForce.load();
    if (looks == nullptr) return false;
    const int before = errno;
    const std::lock_guard lock(looks->mutex_);
    const int error = looks->errorOf_ ? looks->errorOf_({name, path == nullptr ? "" : path}) : 0;
    errno = error == 0 ? before : error;
    return error != 0;
  }
};

}  // namespace docuvend::linux_platform

using docuvend::linux_platform::InterposedLookCalls;

extern "C" {
int __real_open(const char*, int, mode_t);
int __real_openat(int, const char*, int, mode_t);
DIR* __real_opendir(const char*);
dirent* __real_readdir(DIR*);
char* __real_realpath(const char*, char*);
int __real_lstat(const char*, struct stat*);
int __real_stat(const char*, struct stat*);
int __real_fstat(int, struct stat*);
int __real_fstatat(int, const char*, struct stat*, int);
int __real_statx(int, const char*, int, unsigned, struct statx*);
ssize_t __real_read(int, void*, std::size_t);
long __real_syscall(long, long, long, long, long, long, long);

int __wrap_open(const char* path, int flags, mode_t mode) {
  return InterposedLookCalls::fails("open", path) ? -1 : __real_open(path, flags, mode);
}

int __wrap_openat(int directory, const char* path, int flags, mode_t mode) {
  return InterposedLookCalls::fails("openat", path) ? -1 : __real_openat(directory, path, flags, mode);
}

DIR* __wrap_opendir(const char* path) { return InterposedLookCalls::fails("opendir", path) ? nullptr : __real_opendir(path); }

dirent* __wrap_readdir(DIR* stream) {
  if (InterposedLookCalls::fails("readdir", nullptr)) return nullptr;
  dirent* const entry = __real_readdir(stream);
  if (entry != nullptr && InterposedLookCalls::areKindsHidden()) entry->d_type = DT_UNKNOWN;
  return entry;
}

char* __wrap_realpath(const char* path, char* target) {
  return InterposedLookCalls::fails("realpath", path) ? nullptr : __real_realpath(path, target);
}

int __wrap_lstat(const char* path, struct stat* status) {
  return InterposedLookCalls::fails("lstat", path) ? -1 : __real_lstat(path, status);
}

int __wrap_stat(const char* path, struct stat* status) { return InterposedLookCalls::fails("stat", path) ? -1 : __real_stat(path, status); }

int __wrap_fstat(int file, struct stat* status) { return InterposedLookCalls::fails("fstat", nullptr) ? -1 : __real_fstat(file, status); }

int __wrap_fstatat(int directory, const char* path, struct stat* status, int flags) {
  return InterposedLookCalls::fails("fstatat", path) ? -1 : __real_fstatat(directory, path, status, flags);
}

int __wrap_statx(int directory, const char* path, int flags, unsigned mask, struct statx* status) {
  return InterposedLookCalls::fails("statx", path) ? -1 : __real_statx(directory, path, flags, mask, status);
}

ssize_t __wrap_read(int file, void* bytes, std::size_t size) {
  return InterposedLookCalls::fails("read", nullptr) ? -1 : __real_read(file, bytes, size);
}

long __wrap_syscall(long number, long a, long b, long c, long d, long e, long f) {
  const bool fails = number == SYS_openat2 && InterposedLookCalls::fails("openat2", reinterpret_cast<const char*>(b));
  return fails ? -1 : __real_syscall(number, a, b, c, d, e, f);
}
}
