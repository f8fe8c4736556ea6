#include "platform/linux/log/LogAllowance.h"

#include <algorithm>

namespace docuvend::linux_platform {

// Who has not written for as long as a whole allowance takes is like one who never wrote; they are forgotten when somebody new comes.
bool LogAllowance::line(const std::string& subject, Time now) {
  auto found = accounts_.find(subject);
  if (found == accounts_.end()) {
    std::erase_if(accounts_, [now](const auto& known) { return known.second.isUntouched(now); });
    found = accounts_.emplace(subject, LineAllowance({kLinesAtOnce, kTimeForALine})).first;
  }
  const bool isAllowed = found->second.line(now);
  noteCountOf(found->second);
  return isAllowed;
}

std::vector<LogAllowance::LeftOut> LogAllowance::dueCounts(Time now) {
  std::vector<LeftOut> due;
  if (!nextCount_ || now < *nextCount_) return due;
  nextCount_.reset();
  for (auto& [subject, account] : accounts_) {
    if (const std::size_t lines = account.dueCount(now); lines > 0) due.push_back({subject, lines});
    noteCountOf(account);
  }
  return due;
}

void LogAllowance::noteCountOf(const LineAllowance& account) {
  if (const auto time = account.timeOfCount()) nextCount_ = std::min(nextCount_.value_or(*time), *time);
}

}  // namespace docuvend::linux_platform
