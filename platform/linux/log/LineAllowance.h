// How many lines somebody may bring into the log.
//
// A value without clock or lock. A burst uses the allowance up, and time brings one line after the other back. What exceeds it is left out
// and counted; the count is told when it is due, a while after the first line that was left out.
#pragma once

#include <chrono>
#include <cstddef>
#include <optional>

namespace docuvend::linux_platform {

class LineAllowance {
 public:
  using Time = std::chrono::steady_clock::time_point;

  static constexpr std::chrono::seconds kTimeUntilCount{10};

  struct Rate {
    std::size_t linesAtOnce;
    std::chrono::milliseconds timeForALine;  // that brings one back
  };
  explicit LineAllowance(Rate rate) : rate_(rate) {}

  // Whether one more may be written.
  [[nodiscard]] bool line(Time now);

  // How many lines have been left out, once that is due, and 0 before; each is told of once.
  [[nodiscard]] std::size_t dueCount(Time now);
  // No line will come: how many have been left out and not told of.
  [[nodiscard]] std::size_t finish();
  // When there will be a count; none while nothing is left out.
  [[nodiscard]] std::optional<Time> timeOfCount() const { return timeOfCount_; }

  // It is like that of somebody who never wrote.
  [[nodiscard]] bool isUntouched(Time now) const { return whole_ <= now && !timeOfCount_; }

 private:
  Rate rate_;
  Time whole_;  // when all lines are allowed again
  std::size_t leftOut_ = 0;
  std::optional<Time> timeOfCount_;  // while something is left out
};

}  // namespace docuvend::linux_platform
