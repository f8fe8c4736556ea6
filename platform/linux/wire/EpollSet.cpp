// Posts are counted by a semaphore-like eventfd: each event lets one thread take one. A second eventfd, never read, tells all threads to
// stop. The kernel tells of what is ready by turns, so posts and descriptors take none from each other.
#include "platform/linux/wire/EpollSet.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <utility>

namespace docuvend::linux_platform {
namespace {

constexpr std::uint64_t kStopKey = 0;
constexpr std::uint64_t kPostKey = 1;

// What the kernel cannot refuse here unless descriptors were closed by others: nothing works any more.
[[noreturn]] void giveUp(const char* what) {
  std::perror(what);
  std::abort();
}

void signal(const UniqueDescriptor& counter, const char* what) {
  const std::uint64_t one = 1;
  if (::write(counter.get(), &one, sizeof one) != sizeof one) giveUp(what);
}

bool control(const UniqueDescriptor& epoll, int operation, int descriptor, std::uint64_t key, std::uint32_t events) {
  epoll_event event{};
  event.events = events;
  event.data.u64 = key;
  return ::epoll_ctl(epoll.get(), operation, descriptor, &event) == 0;
}

}  // namespace

std::unique_ptr<EpollSet> EpollSet::create() {
  auto created = std::unique_ptr<EpollSet>(new EpollSet);
  created->epoll_ = UniqueDescriptor(::epoll_create1(EPOLL_CLOEXEC));
  created->stop_ = UniqueDescriptor(::eventfd(0, EFD_CLOEXEC));
  created->posted_ = UniqueDescriptor(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK | EFD_SEMAPHORE));
  if (!created->epoll_ || !created->stop_ || !created->posted_) return nullptr;
  if (!control(created->epoll_, EPOLL_CTL_ADD, created->stop_.get(), kStopKey, EPOLLIN) ||
      !control(created->epoll_, EPOLL_CTL_ADD, created->posted_.get(), kPostKey, EPOLLIN)) {
    return nullptr;
  }
  return created;
}

EpollSet::Adding EpollSet::add(std::uint64_t key, int descriptor, std::uint32_t events) {
  if (control(epoll_, EPOLL_CTL_ADD, descriptor, key, events | static_cast<std::uint32_t>(EPOLLONESHOT))) return Adding::done;
  return errno == EBADF ? Adding::badDescriptor : Adding::refused;
}

void EpollSet::arm(std::uint64_t key, int descriptor, std::uint32_t events) {
  control(epoll_, EPOLL_CTL_MOD, descriptor, key, events | static_cast<std::uint32_t>(EPOLLONESHOT));
}

void EpollSet::remove(int descriptor) { control(epoll_, EPOLL_CTL_DEL, descriptor, 0, 0); }

void EpollSet::post() { signal(posted_, "cannot post to a reactor"); }

void EpollSet::stop() { signal(stop_, "cannot stop a reactor"); }

EpollSet::Event EpollSet::wait() {
  while (true) {
    epoll_event event{};
    const int count = ::epoll_wait(epoll_.get(), &event, 1, -1);
    if (count < 0 && errno != EINTR) giveUp("epoll_wait");
    if (count <= 0) continue;
    if (event.data.u64 == kStopKey) return {Event::Kind::stopped};
    if (event.data.u64 != kPostKey) return {Event::Kind::ready, event.data.u64, event.events};
    std::uint64_t one = 0;
    if (::read(posted_.get(), &one, sizeof one) == sizeof one) return {Event::Kind::posted};
    // Another thread was faster.
  }
}

}  // namespace docuvend::linux_platform
