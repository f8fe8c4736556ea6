#include "platform/linux/extension_host/Timer.h"

#include <sys/epoll.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <utility>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

struct Timer::State {
  UniqueDescriptor descriptor;
  std::function<void()> handler;
};

Timer::Timer(Reactor& reactor, std::function<void()> handler) : state_(std::make_shared<State>()) {
  state_->descriptor.reset(timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK));
  state_->handler = std::move(handler);
  if (!state_->descriptor) return;
  registration_ = reactor.watch(state_->descriptor.get(), EPOLLIN, [weak = std::weak_ptr(state_)](std::uint32_t) -> std::uint32_t {
    const auto state = weak.lock();
    if (!state) return 0;
    std::uint64_t expirations = 0;
    if (read(state->descriptor.get(), &expirations, sizeof expirations) == sizeof expirations) state->handler();
    return EPOLLIN;
  });
}

Timer::~Timer() = default;

void Timer::setFor(std::chrono::steady_clock::time_point time) {
  // The steady clock is CLOCK_MONOTONIC. A zero time would switch the timer off; one that is past fires at once.
  const auto since = std::max(time.time_since_epoch(), std::chrono::steady_clock::duration(1));
  const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(since);
  itimerspec setting{};
  setting.it_value.tv_sec = seconds.count();
  setting.it_value.tv_nsec = std::chrono::duration_cast<std::chrono::nanoseconds>(since - seconds).count();
  timerfd_settime(state_->descriptor.get(), TFD_TIMER_ABSTIME, &setting, nullptr);
}

}  // namespace docuvend::linux_platform
