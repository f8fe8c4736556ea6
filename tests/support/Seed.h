// The seed of a random test's run. It is printed; --gtest_random_seed=SEED repeats the run.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <iostream>
#include <random>

namespace docuvend::tests {

inline std::uint32_t seedOfThisRun() {
  const auto given = static_cast<std::uint32_t>(GTEST_FLAG_GET(random_seed));
  const std::uint32_t seed = given != 0 ? given : std::random_device{}() % 99999 + 1;  // as the flag allows
  std::cout << "seed " << seed << "\n";
  return seed;
}

}  // namespace docuvend::tests
