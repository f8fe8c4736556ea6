// Waiting for what another process or thread brings about, by looking again and again.
#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <string>
#include <thread>

#include "tests/wire/Waiting.h"

namespace docuvend::tests {

// True as soon as the condition is; false, and a test failure, when it never becomes so.
inline bool eventually(const std::string& what, const std::function<bool()>& condition) {
  static constexpr std::chrono::milliseconds kBetweenLooks{2};
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) {
      ADD_FAILURE() << "never: " << what;
      return false;
    }
    std::this_thread::sleep_for(kBetweenLooks);
  }
  return true;
}

}  // namespace docuvend::tests
