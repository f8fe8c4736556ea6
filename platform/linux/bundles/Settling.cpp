#include "platform/linux/bundles/Settling.h"

#include <algorithm>
#include <vector>

namespace docuvend::linux_platform {

void Settling::changed(Time now) {
  if (!pending_) pending_ = Span{now, now};
  pending_->last = now;
  if (!lastFind_ || now - *lastFind_ <= kBusy) return;
  quiet_ = kShortestQuiet;
  wait_ = kFirstWait;
}

void Settling::wasWritten(const std::string& bundle, Time now) { written_.try_emplace(bundle, Span{now, now}).first->second.last = now; }

// One exchange is told as several renames at one time.
void Settling::wasRenamed(const std::string& bundle, Time now) {
  const auto [last, isFirst] = renamed_.try_emplace(bundle, now);
  if (isFirst || now - last->second > kComesAndGoes) {
    written_.erase(bundle);
  } else if (now > last->second) {
    wasWritten(bundle, now);
  }
  last->second = now;
}

// A bundle that has been quiet for long enough is a change like any other.
std::optional<Settling::Time> Settling::nextLook() const {
  std::vector<Time> ends;
  for (const auto& [bundle, span] : written_) ends.push_back(endOf(span));
  std::sort(ends.begin(), ends.end());
  auto waiting = pending_;
  for (const Time end : ends) {
    if (waiting && end > lookAfter(*waiting)) break;
    waiting = waiting ? Span{std::min(waiting->first, end), std::max(waiting->last, end)} : Span{end, end};
  }
  if (!waiting) return std::nullopt;
  return lookAfter(*waiting);
}

std::set<std::string> Settling::unsettled(Time now) const {
  std::set<std::string> result;
  for (const auto& [bundle, span] : written_) {
    if (now < endOf(span)) result.insert(bundle);
  }
  return result;
}

void Settling::looked(Time began, Found found) {
  pending_.reset();
  std::erase_if(written_, [began](const auto& entry) { return endOf(entry.second) <= began; });
  std::erase_if(renamed_, [began](const auto& entry) { return began - entry.second > kComesAndGoes; });
  if (found == Found::nothingNew) return;
  quiet_ = std::min(quiet_ * 2, kLongestQuiet);
  wait_ = std::min(wait_ * 2, kLongestWait);
  lastFind_ = began;
}

}  // namespace docuvend::linux_platform
