// How many lines the log takes about one subject, so that no peer fills a disk or drowns what is said of others.
//
// A value without clock or lock: a LineAllowance for each subject.
#pragma once

#include <chrono>
#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/log/LineAllowance.h"

namespace docuvend::linux_platform {

class LogAllowance {
 public:
  using Time = LineAllowance::Time;

  static constexpr std::size_t kLinesAtOnce = 200;
  // Who goes on at this rate, with the longest lines (kLongestLogText), writes 332 MB in a day.
  static constexpr std::chrono::seconds kTimeForALine{1};

  // Whether one more may be written.
  [[nodiscard]] bool line(const std::string& subject, Time now);

  struct LeftOut {
    std::string subject;
    std::size_t lines;
  };
  // What has been left out and is to be told now; it is not given again.
  [[nodiscard]] std::vector<LeftOut> dueCounts(Time now);

 private:
  void noteCountOf(const LineAllowance& account);

  std::map<std::string, LineAllowance> accounts_;  // of those who wrote lately, or whose count is not told
  std::optional<Time> nextCount_;
};

}  // namespace docuvend::linux_platform
