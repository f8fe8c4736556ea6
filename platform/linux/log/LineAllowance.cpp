#include "platform/linux/log/LineAllowance.h"

#include <algorithm>
#include <utility>

namespace docuvend::linux_platform {

bool LineAllowance::line(Time now) {
  const Time whole = std::max(whole_, now) + rate_.timeForALine;
  if (whole - now <= rate_.linesAtOnce * rate_.timeForALine) {
    whole_ = whole;
    return true;
  }
  ++leftOut_;
  if (!timeOfCount_) timeOfCount_ = now + kTimeUntilCount;
  return false;
}

std::size_t LineAllowance::dueCount(Time now) { return timeOfCount_ && *timeOfCount_ <= now ? finish() : 0; }

std::size_t LineAllowance::finish() {
  timeOfCount_.reset();
  return std::exchange(leftOut_, 0);
}

}  // namespace docuvend::linux_platform
