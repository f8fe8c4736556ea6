// The linker sends every call of the listed names to __wrap_NAME, and __real_NAME is the system's own (--wrap in CMakeLists.txt).

#include "tests/files/system_calls.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cassert>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <utility>

namespace docuvend::test {
namespace {

thread_local SystemCalls* inForce = nullptr;

// False when the call is to fail; errno is set then.
bool mayPass(const char* name) {
  if (inForce == nullptr) return true;
  const int error = inForce->enter(name);
  if (error != 0) errno = error;
  return error == 0;
}

}  // namespace

SystemCalls::SystemCalls(CallFailure failure) : failure_(failure) {
  assert(inForce == nullptr);
  inForce = this;
}

SystemCalls::~SystemCalls() { inForce = nullptr; }

int SystemCalls::enter(const char* name) {
  names_.emplace_back(name);
  const bool fails =
      failure_.number != 0 && (failure_.span == FailureSpan::once ? names_.size() == failure_.number : names_.size() >= failure_.number);
  failed_ = failed_ || fails;
  return fails ? failure_.error : 0;
}

int SystemCalls::enterOpening(Opening opening) {
  const bool fails = opening.isInCacheAlone && opening.path == cacheFailure_.path && cacheFailure_.times > 0;
  openings_.push_back(std::move(opening));
  if (!fails) return 0;
  --cacheFailure_.times;
  return cacheFailure_.error;
}

}  // namespace docuvend::test

using docuvend::test::inForce;
using docuvend::test::mayPass;

extern "C" {

long __real_syscall(long, ...);
int __real_open(const char*, int, ...);
int __real_openat(int, const char*, int, ...);
ssize_t __real_read(int, void*, size_t);
ssize_t __real_write(int, const void*, size_t);
int __real_fstat(int, struct stat*);
int __real_fstatat(int, const char*, struct stat*, int);
int __real_lstat(const char*, struct stat*);
int __real_fsync(int);
int __real_linkat(int, const char*, int, const char*, int);
int __real_renameat(int, const char*, int, const char*);
int __real_renameat2(int, const char*, int, const char*, unsigned);
ssize_t __real_getrandom(void*, size_t, unsigned);
uid_t __real_geteuid();

// Like the system's own it takes six arguments from where they would be, however many there are.
__attribute__((no_sanitize("address"))) long __wrap_syscall(long number, ...) {
  constexpr std::size_t kArguments = 6;
  std::array<long, kArguments> of{};
  va_list rest;
  va_start(rest, number);
  for (long& argument : of) argument = va_arg(rest, long);
  va_end(rest);
  if (number == SYS_openat2 && inForce != nullptr) {
    const auto& how = *reinterpret_cast<const open_how*>(of[2]);
    const int error = inForce->enterOpening({reinterpret_cast<const char*>(of[1]), (how.resolve & RESOLVE_CACHED) != 0});
    if (error != 0) {
      errno = error;
      return -1;
    }
  }
  return __real_syscall(number, of[0], of[1], of[2], of[3], of[4], of[5]);
}

int __wrap_open(const char* path, int flags, ...) {
  va_list rest;
  va_start(rest, flags);
  const unsigned mode = (flags & (O_CREAT | O_TMPFILE)) != 0 ? va_arg(rest, unsigned) : 0;
  va_end(rest);
  if (inForce != nullptr) inForce->enterOpening({path, /*isInCacheAlone=*/false});
  return mayPass("open") ? __real_open(path, flags, mode) : -1;
}

int __wrap_openat(int directory, const char* path, int flags, ...) {
  va_list rest;
  va_start(rest, flags);
  const unsigned mode = (flags & (O_CREAT | O_TMPFILE)) != 0 ? va_arg(rest, unsigned) : 0;
  va_end(rest);
  return mayPass("openat") ? __real_openat(directory, path, flags, mode) : -1;
}

ssize_t __wrap_read(int file, void* bytes, size_t size) { return mayPass("read") ? __real_read(file, bytes, size) : -1; }

ssize_t __wrap_write(int file, const void* bytes, size_t size) {
  if (!mayPass("write")) return -1;
  if (inForce != nullptr && inForce->writeLimit()) size = std::min(size, *inForce->writeLimit());
  return __real_write(file, bytes, size);
}

int __wrap_fstat(int file, struct stat* status) { return mayPass("fstat") ? __real_fstat(file, status) : -1; }

int __wrap_fstatat(int directory, const char* path, struct stat* status, int flags) {
  return mayPass("fstatat") ? __real_fstatat(directory, path, status, flags) : -1;
}

int __wrap_lstat(const char* path, struct stat* status) { return mayPass("lstat") ? __real_lstat(path, status) : -1; }

int __wrap_fsync(int file) { return mayPass("fsync") ? __real_fsync(file) : -1; }

int __wrap_linkat(int from, const char* name, int to, const char* second, int flags) {
  return mayPass("linkat") ? __real_linkat(from, name, to, second, flags) : -1;
}

int __wrap_renameat(int from, const char* name, int to, const char* second) {
  return mayPass("renameat") ? __real_renameat(from, name, to, second) : -1;
}

int __wrap_renameat2(int from, const char* name, int to, const char* second, unsigned flags) {
  return mayPass("renameat2") ? __real_renameat2(from, name, to, second, flags) : -1;
}

ssize_t __wrap_getrandom(void* bytes, size_t size, unsigned flags) {
  return mayPass("getrandom") ? __real_getrandom(bytes, size, flags) : -1;
}

uid_t __wrap_geteuid() { return inForce != nullptr && inForce->user() ? *inForce->user() : __real_geteuid(); }

}  // extern "C"
