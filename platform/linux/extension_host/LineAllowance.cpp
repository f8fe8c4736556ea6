#include "platform/linux/extension_host/LineAllowance.h"

#include <utility>

namespace docuvend::linux_platform {

LineAllowance::Verdict LineAllowance::line(Time now) {
  Verdict verdict{0, true};
  if (!periodBegan_ || now - *periodBegan_ >= kPeriod) {
    periodBegan_ = now;
    allowed_ = 0;
    verdict.droppedBefore = finish();
  }
  if (allowed_ < kLinesOfAPeriod) {
    ++allowed_;
  } else {
    verdict.isAllowed = false;
    ++dropped_;
  }
  return verdict;
}

std::size_t LineAllowance::finish() { return std::exchange(dropped_, 0); }

}  // namespace docuvend::linux_platform
