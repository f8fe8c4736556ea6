// Stands between this test program and the system's calls on files: counts them and lets one fail. Only calls of the thread that made the
// object count, and one object is in force at a time.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

namespace docuvend::test {

enum class FailureSpan { once, forGood };

struct CallFailure {
  std::size_t number = 0;  // counted from 1; 0: none fails
  FailureSpan span = FailureSpan::once;
  int error = 0;
};

// A path that was opened, by open or openat2.
struct Opening {
  std::string path;
  bool isInCacheAlone = false;
};

class SystemCalls {
 public:
  explicit SystemCalls(CallFailure failure = {});
  SystemCalls(const SystemCalls&) = delete;
  SystemCalls& operator=(const SystemCalls&) = delete;
  ~SystemCalls();

  // The names of the calls so far.
  [[nodiscard]] const std::vector<std::string>& names() const { return names_; }
  [[nodiscard]] bool hasFailed() const { return failed_; }

  [[nodiscard]] const std::vector<Opening>& openings() const { return openings_; }
  // So many openings of that path in the kernel's cache alone fail with that error.
  void failInCache(const std::string& path, int error, std::size_t times) { cacheFailure_ = {path, error, times}; }

  // The most that one write takes from now on.
  void limitWrites(std::size_t bytes) { writeLimit_ = bytes; }
  // Whom the process runs as, as far as it can see.
  void setEffectiveUser(uid_t user) { user_ = user; }

  // For the calls: 0, or the error with which this one fails.
  int enter(const char* name);
  int enterOpening(Opening opening);
  [[nodiscard]] std::optional<std::size_t> writeLimit() const { return writeLimit_; }
  [[nodiscard]] std::optional<uid_t> user() const { return user_; }

 private:
  struct CacheFailure {
    std::string path;
    int error = 0;
    std::size_t times = 0;
  };

  const CallFailure failure_;
  std::vector<std::string> names_;
  std::vector<Opening> openings_;
  CacheFailure cacheFailure_;
  bool failed_ = false;
  std::optional<std::size_t> writeLimit_;
  std::optional<uid_t> user_;
};

}  // namespace docuvend::test
