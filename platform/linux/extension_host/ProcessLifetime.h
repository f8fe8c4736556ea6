// Decides when the process of one extension is started, shared, kept and ended, and when it is not started at all.
//
// A value without clock, lock or process: it is told what happened and when. The owner does what the results ask for and guards it with a
// lock of its own. At most one process exists at a time: requests that come while one is starting or ending wait for the next.
//
// A process that died quickly, could not be started, or was ended because it did not answer counts as a bad life. The first in a row has
// no consequence; from the second on, requests are refused for a while that doubles each time. A good life ends the row.
//
// What is installed may go, or be another: then the process is retired. Until a time that its owner says it serves requests and is not kept
// without any; then it is over, whatever is open: requests are refused for good.
#pragma once

#include <chrono>
#include <cstddef>
#include <optional>
#include <set>

#include "platform/QXUUID.h"
#include "platform/linux/extension_host/ExtensionTimes.h"

namespace docuvend::linux_platform {

class ProcessLifetime {
 public:
  using Time = std::chrono::steady_clock::time_point;
  enum class Begin {
    start,   // start a process; the request waits for it
    wait,    // the request waits for the process that is starting, or for the one that follows the one that is ending
    join,    // the process runs and the request is open
    refuse,  // backing off, or over; the request is forgotten
  };
  enum class Cause { died, notAnswering };
  enum class Next { nothing, start };
  enum class Phase { none, starting, running, ending };

  explicit ProcessLifetime(const ExtensionTimes& times) : times_(times) {}

  [[nodiscard]] Begin begin(const QXUUID& request, Time now);
  // Unknown requests are ignored.
  void finish(const QXUUID& request, Time now);
  [[nodiscard]] bool isOpen(const QXUUID& request) const { return phase_ == Phase::running && open_.contains(request); }

  // The process that was to be started runs: waiting requests are open. Or it does not: they are forgotten.
  void started(Time now);
  void startFailed(Time now);
  // The running process is of no more use; its requests are forgotten. Ignored when it is being ended already.
  void lost(Cause cause, Time now);
  // The idle process is being ended.
  void endedIdle();
  // The process is gone. `start`: requests wait for the next one.
  [[nodiscard]] Next gone();

  // When the running process is to be ended, as long as no request begins. None when it does not run, and, unless it is retired, while it
  // has requests.
  [[nodiscard]] std::optional<Time> deadline() const;
  // The end of the present back-off, if it lies ahead.
  [[nodiscard]] std::optional<Time> refusedUntil(Time now) const;
  [[nodiscard]] int badLivesInARow() const { return badLives_; }
  [[nodiscard]] Phase phase() const { return phase_; }
  // Open ones, and those that wait for a process.
  [[nodiscard]] std::size_t requests() const { return open_.size() + waiting_.size(); }

  // The installation that this process belongs to was updated, replaced or removed: the process is over at `end`. The earliest end counts.
  void retire(Time end);
  [[nodiscard]] bool isRetired() const { return retiredUntil_.has_value(); }
  [[nodiscard]] bool isOver(Time now) const { return retiredUntil_ && *retiredUntil_ <= now; }
  // It is over, and the process, if it runs, is being ended: all requests are forgotten, those that wait too.
  void ended();

 private:
  void countBadLife(Time now);

  ExtensionTimes times_;
  Phase phase_ = Phase::none;
  std::set<QXUUID> waiting_;
  std::set<QXUUID> open_;
  Time startedAt_;
  Time idleSince_;
  int badLives_ = 0;
  std::optional<Time> refusedUntil_;
  std::optional<Time> retiredUntil_;
};

}  // namespace docuvend::linux_platform
