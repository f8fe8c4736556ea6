// How many lines a process may bring into the log.
//
// A value without clock or lock. Time is cut into periods, the first of which begins with the first line; of each period the first lines
// are allowed and the rest are dropped.
#pragma once

#include <chrono>
#include <cstddef>
#include <optional>

namespace docuvend::linux_platform {

class LineAllowance {
 public:
  using Time = std::chrono::steady_clock::time_point;

  static constexpr std::size_t kLinesOfAPeriod = 100;
  static constexpr std::chrono::seconds kPeriod{10};

  struct Verdict {
    std::size_t droppedBefore;  // lines that were dropped in periods that are over, each told of once
    bool isAllowed;
  };
  [[nodiscard]] Verdict line(Time now);
  // No line will come: how many have been dropped and not told of.
  [[nodiscard]] std::size_t finish();

 private:
  std::optional<Time> periodBegan_;
  std::size_t allowed_ = 0;  // in this period
  std::size_t dropped_ = 0;
};

}  // namespace docuvend::linux_platform
