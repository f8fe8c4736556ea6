// Calls a handler at a point in time.
#pragma once

#include <chrono>
#include <functional>
#include <memory>

#include "platform/linux/wire/Reactor.h"

namespace docuvend::linux_platform {

class Timer {
 public:
  // The handler runs on a thread of the reactor, and may still be running when the timer is gone: it must hold what it needs.
  Timer(Reactor& reactor, std::function<void()> handler);
  Timer(const Timer&) = delete;
  Timer& operator=(const Timer&) = delete;
  ~Timer();

  // False: the system gave it nothing to wait with, and the handler never runs.
  [[nodiscard]] bool isUsable() const { return registration_ != nullptr; }

  // The handler runs once, at or after that time. Replaces the time that was set before. May be called from any thread.
  void setFor(std::chrono::steady_clock::time_point time);

 private:
  struct State;
  std::shared_ptr<State> state_;
  std::shared_ptr<Reactor::Registration> registration_;  // goes first: it watches a descriptor of the state
};

}  // namespace docuvend::linux_platform
