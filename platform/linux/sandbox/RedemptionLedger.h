// Which launch of an application has been given which file for writing.
//
// Bounded for each launch and as a whole; where it is full the oldest entry goes, and its launch must redeem the token again. May be used
// from any thread.
#pragma once

#include <cstddef>
#include <deque>
#include <mutex>
#include <string>
#include <vector>

#include "platform/linux/sandbox/Resolution.h"

namespace docuvend::linux_platform {

class RedemptionLedger {
 public:
  static constexpr std::size_t kMaximumObjectsPerInstance = 256;
  static constexpr std::size_t kMaximumInstances = 256;

  struct Written {
    ObjectIdentity object;
    std::string path;  // by which it was named
  };

  // An empty instance names nobody's launch and is not entered.
  void enter(const std::string& instance, Written written);
  // What was named by a path that begins with one of these; they end in "/".
  void forgetBelow(const std::vector<std::string>& directories);
  void forgetAll();
  [[nodiscard]] bool holds(const std::string& instance, const ObjectIdentity& object) const;

 private:
  struct Entry {
    std::string instance;
    std::deque<Written> objects;  // oldest first, each once
  };

  mutable std::mutex mutex_;
  std::vector<Entry> entries_;  // guarded by mutex_; the launch that was given a file last stands last
};

}  // namespace docuvend::linux_platform
