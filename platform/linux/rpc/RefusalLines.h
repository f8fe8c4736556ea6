// Which refusals are worth a line in the log: each peer's first, and then one in a while, so that nobody fills the log by knocking at a
// door that is not for him, nor hides another's knocking behind his own.
#pragma once

#include <chrono>
#include <map>
#include <string>

namespace docuvend::linux_platform {

inline constexpr std::chrono::seconds kTimeBetweenRefusalLines{60};  // of one peer

class RefusalLines {
 public:
  using Time = std::chrono::steady_clock::time_point;

  // `peer` is what its connections are counted by: a confined process cannot make itself a new one.
  [[nodiscard]] bool isDue(const std::string& peer, Time now);

 private:
  std::map<std::string, Time> written_;  // of the peers whose next line is not due yet
};

}  // namespace docuvend::linux_platform
