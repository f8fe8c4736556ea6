// A platform status that a test sets.
//
// Differs from the real one: it is what was set, at first nothing. May be used from any thread.
#pragma once

#include <mutex>
#include <utility>

#include "platform/status.h"

namespace docuvend::fake_platform {

class FakeStatus final : public QXStatusSource {
 public:
  void set(QXDictionary status) {
    const std::lock_guard lock(mutex_);
    status_ = std::move(status);
  }

  QXDictionary platformStatus() override {
    const std::lock_guard lock(mutex_);
    return status_;
  }

 private:
  std::mutex mutex_;
  QXDictionary status_;  // guarded by mutex_
};

}  // namespace docuvend::fake_platform
