// How many lines the log takes about one subject, so that no peer fills a disk or drowns what is said of others.
//
// A value without clock or lock. Each subject has an allowance that a burst uses up and that time brings back. What exceeds it is left out
// and counted; the count is told when it is due, a while after the first line that was left out.
#pragma once

#include <chrono>
#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace docuvend::linux_platform {

class LogAllowance {
 public:
  using Time = std::chrono::steady_clock::time_point;

  static constexpr std::size_t kLinesAtOnce = 200;
  static constexpr std::chrono::milliseconds kTimeForALine{100};
  static constexpr std::chrono::seconds kTimeUntilCount{10};

  // Whether one more may be written.
  [[nodiscard]] bool line(const std::string& subject, Time now);

  struct LeftOut {
    std::string subject;
    std::size_t lines;
  };
  // What has been left out and is to be told now; it is not given again.
  [[nodiscard]] std::vector<LeftOut> dueCounts(Time now);

 private:
  struct Account {
    Time whole;  // when all lines are allowed again
    std::size_t leftOut = 0;
    Time firstLeftOut;
  };

  std::map<std::string, Account> accounts_;  // of those who wrote lately, or whose count is not told
  std::optional<Time> nextCount_;
};

}  // namespace docuvend::linux_platform
