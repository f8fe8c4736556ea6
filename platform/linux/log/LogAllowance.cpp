#include "platform/linux/log/LogAllowance.h"

#include <algorithm>
#include <utility>

namespace docuvend::linux_platform {

// Who has not written for as long as a whole allowance takes is like one who never wrote; they are forgotten when somebody new comes.
bool LogAllowance::line(const std::string& subject, Time now) {
  constexpr auto kWhole = kLinesAtOnce * kTimeForALine;
  auto found = accounts_.find(subject);
  if (found == accounts_.end()) {
    std::erase_if(accounts_, [now](const auto& known) { return known.second.whole <= now && known.second.leftOut == 0; });
    found = accounts_.emplace(subject, Account{}).first;
  }
  Account& account = found->second;
  const Time whole = std::max(account.whole, now) + kTimeForALine;
  if (whole - now <= kWhole) {
    account.whole = whole;
    return true;
  }
  if (account.leftOut++ == 0) {
    account.firstLeftOut = now;
    if (!nextCount_) nextCount_ = now + kTimeUntilCount;
  }
  return false;
}

std::vector<LogAllowance::LeftOut> LogAllowance::dueCounts(Time now) {
  std::vector<LeftOut> due;
  if (!nextCount_ || now < *nextCount_) return due;
  nextCount_.reset();
  for (auto& [subject, account] : accounts_) {
    if (account.leftOut == 0) continue;
    const Time time = account.firstLeftOut + kTimeUntilCount;
    if (time <= now) {
      due.push_back({subject, std::exchange(account.leftOut, 0)});
    } else {
      nextCount_ = nextCount_ ? std::min(*nextCount_, time) : time;
    }
  }
  return due;
}

}  // namespace docuvend::linux_platform
