#include "platform/linux/wire/PollThread.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <cerrno>
#include <chrono>
#include <system_error>
#include <utility>
#include <vector>

namespace docuvend::linux_platform {
namespace {

constexpr std::chrono::milliseconds kPauseAfterFailure{10};

}  // namespace

PollThread::PollThread(Ready ready, UniqueDescriptor wakeUp) : ready_(std::move(ready)), wakeUp_(std::move(wakeUp)) {}

std::unique_ptr<PollThread> PollThread::start(Ready ready) {
  UniqueDescriptor wakeUp(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
  if (!wakeUp) return nullptr;
  auto waiting = std::unique_ptr<PollThread>(new PollThread(std::move(ready), std::move(wakeUp)));
  try {
    waiting->thread_ = std::thread([self = waiting.get()] { self->run(); });
  } catch (const std::system_error&) {
    return nullptr;
  }
  return waiting;
}

PollThread::~PollThread() {
  {
    const std::lock_guard lock(mutex_);
    over_ = true;
  }
  interrupt();
  if (thread_.joinable()) thread_.join();
}

void PollThread::arm(std::uint64_t key, int descriptor, std::uint32_t events) {
  {
    const std::lock_guard lock(mutex_);
    armed_.insert_or_assign(key, Armed{descriptor, events});
  }
  interrupt();
}

// The call to poll(2) that may be under way need not know: what it says of this descriptor, or of another one that gets its number, finds
// no key.
void PollThread::letGo(std::uint64_t key) {
  const std::lock_guard lock(mutex_);
  armed_.erase(key);
}

void PollThread::interrupt() const {
  const std::uint64_t one = 1;
  static_cast<void>(!::write(wakeUp_.get(), &one, sizeof one));  // it fails when the counter is full: then it is awake
}

void PollThread::run() {
  std::vector<pollfd> descriptors;
  std::vector<std::uint64_t> keys;
  while (true) {
    descriptors.assign(1, {wakeUp_.get(), POLLIN, 0});
    keys.assign(1, 0);
    {
      const std::lock_guard lock(mutex_);
      if (over_) return;
      for (const auto& [key, armed] : armed_) {
        descriptors.push_back({armed.descriptor, static_cast<short>(armed.events), 0});
        keys.push_back(key);
      }
    }
    if (::poll(descriptors.data(), descriptors.size(), -1) < 0) {
      if (errno != EINTR) std::this_thread::sleep_for(kPauseAfterFailure);  // the system has no memory for the call now
      continue;
    }
    if (descriptors[0].revents != 0) {
      std::uint64_t count = 0;
      static_cast<void>(!::read(wakeUp_.get(), &count, sizeof count));
    }
    for (std::size_t i = 1; i < descriptors.size(); ++i) {
      if (descriptors[i].revents == 0) continue;
      {
        const std::lock_guard lock(mutex_);
        if (armed_.erase(keys[i]) == 0) continue;
      }
      ready_(keys[i], static_cast<std::uint32_t>(static_cast<unsigned short>(descriptors[i].revents)));
    }
  }
}

}  // namespace docuvend::linux_platform
