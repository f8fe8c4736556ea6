// A device lock that a test sets, and that counts how often it is asked.
//
// Differs from the real one: the two answers are independent of each other. May be used from any thread.
#pragma once

#include <atomic>
#include <functional>

#include "platform/device_lock.h"

namespace docuvend::fake_platform {

class FakeDeviceLock : public QXDeviceLock {
 public:
  int lockState() override {
    ++lockStateQuestions;
    if (onLockStateQuestion) onLockStateQuestion();
    return state;
  }
  bool unlockedSinceBoot() override {
    ++unlockedSinceBootQuestions;
    return unlocked;
  }

  std::atomic<int> state = kQXLockStateUnprotected;
  std::atomic<bool> unlocked = false;
  std::atomic<int> lockStateQuestions = 0;
  std::atomic<int> unlockedSinceBootQuestions = 0;
  std::function<void()> onLockStateQuestion;  // called inside the question; set before anybody asks
};

}  // namespace docuvend::fake_platform
