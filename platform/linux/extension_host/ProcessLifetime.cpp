#include "platform/linux/extension_host/ProcessLifetime.h"

#include <algorithm>
#include <cassert>

namespace docuvend::linux_platform {
namespace {

constexpr int kBadLivesBeforeBackOff = 2;

}  // namespace

ProcessLifetime::Begin ProcessLifetime::begin(const QXUUID& request, Time now) {
  if (isOver(now)) return Begin::refuse;
  if (phase_ == Phase::running) {
    open_.insert(request);
    return Begin::join;
  }
  if (phase_ != Phase::starting && refusedUntil(now)) return Begin::refuse;
  waiting_.insert(request);
  if (phase_ != Phase::none) return Begin::wait;
  phase_ = Phase::starting;
  return Begin::start;
}

void ProcessLifetime::finish(const QXUUID& request, Time now) {
  if (open_.erase(request) > 0 && open_.empty()) idleSince_ = now;
}

void ProcessLifetime::started(Time now) {
  assert(phase_ == Phase::starting);
  phase_ = Phase::running;
  startedAt_ = now;
  idleSince_ = now;
  open_.merge(waiting_);
  waiting_.clear();
}

void ProcessLifetime::startFailed(Time now) {
  assert(phase_ == Phase::starting);
  phase_ = Phase::none;
  waiting_.clear();
  countBadLife(now);
}

void ProcessLifetime::lost(Cause cause, Time now) {
  if (phase_ != Phase::running) return;
  phase_ = Phase::ending;
  open_.clear();
  if (cause == Cause::notAnswering || now - startedAt_ < times_.quickDeath) {
    countBadLife(now);
  } else {
    badLives_ = 0;
  }
}

void ProcessLifetime::endedIdle() {
  assert(phase_ == Phase::running && open_.empty());
  phase_ = Phase::ending;
  badLives_ = 0;
}

ProcessLifetime::Next ProcessLifetime::gone() {
  assert(phase_ == Phase::ending);
  phase_ = waiting_.empty() ? Phase::none : Phase::starting;
  return phase_ == Phase::starting ? Next::start : Next::nothing;
}

void ProcessLifetime::retire(Time end) { retiredUntil_ = retiredUntil_ ? std::min(*retiredUntil_, end) : end; }

void ProcessLifetime::ended() {
  if (phase_ == Phase::running) phase_ = Phase::ending;
  open_.clear();
  waiting_.clear();
}

std::optional<ProcessLifetime::Time> ProcessLifetime::deadline() const {
  if (phase_ != Phase::running) return std::nullopt;
  if (!open_.empty()) return retiredUntil_;
  return retiredUntil_ ? std::min(idleSince_, *retiredUntil_) : idleSince_ + times_.linger;
}

std::optional<ProcessLifetime::Time> ProcessLifetime::refusedUntil(Time now) const {
  if (!refusedUntil_ || *refusedUntil_ <= now) return std::nullopt;
  return refusedUntil_;
}

void ProcessLifetime::countBadLife(Time now) {
  ++badLives_;
  if (badLives_ < kBadLivesBeforeBackOff) return;
  ExtensionTimes::Duration pause = times_.firstBackOff;
  for (int i = kBadLivesBeforeBackOff; i < badLives_ && pause < times_.longestBackOff; ++i) pause *= 2;
  refusedUntil_ = now + std::min(pause, times_.longestBackOff);
}

}  // namespace docuvend::linux_platform
