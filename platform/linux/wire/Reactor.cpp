#include "platform/linux/wire/Reactor.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cassert>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <deque>
#include <map>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"

// One epoll instance, several threads that wait on it, one event at a time each.
//
// A watched descriptor is armed for one event: the thread that gets it owns the registration until its handler has returned, and arms it
// again with the handler's result and with what others asked for meanwhile. Events carry a number, not a pointer: an event of a
// registration that has been dropped in between finds nothing. Handlers are called with no lock held.
//
// Posted tasks are counted by a semaphore-like eventfd: each event lets one thread take one. A second eventfd, never read, tells all
// threads to stop.

namespace docuvend::linux_platform {
namespace {

constexpr std::uint64_t kStopKey = 0;
constexpr std::uint64_t kPostKey = 1;
constexpr std::uint64_t kFirstWatchKey = 2;

[[noreturn]] void giveUp(const char* what) {
  std::perror(what);
  std::abort();
}

struct Watched {
  int descriptor;
  std::shared_ptr<Reactor::Handler> handler;
  std::uint32_t armed = 0;
  std::uint32_t wantedMeanwhile = 0;  // asked for while the handler runs
  bool running = false;
};

}  // namespace

struct Reactor::State {
  // Constant after construction.
  UniqueDescriptor epoll;
  UniqueDescriptor stop;
  UniqueDescriptor posted;
  std::vector<std::thread> threads;

  std::mutex mutex;  // guards the rest
  std::uint64_t nextKey = kFirstWatchKey;
  std::map<std::uint64_t, Watched> watches;
  std::deque<std::function<void()>> tasks;
  bool over = false;

  void run();
  void runHandler(std::uint64_t key, std::uint32_t events);
  void runTask();
  void post(std::function<void()> task);
  void arm(std::uint64_t key, Watched& watched, std::uint32_t events) const;
  void drop(std::uint64_t key);
  void rearm(std::uint64_t key, std::uint32_t events);
};

class Reactor::Watch final : public Reactor::Registration {
 public:
  Watch(std::shared_ptr<State> state, std::uint64_t key) : state_(std::move(state)), key_(key) {}
  ~Watch() override { state_->drop(key_); }

  void rearm(std::uint32_t events) override { state_->rearm(key_, events); }

 private:
  const std::shared_ptr<State> state_;
  const std::uint64_t key_;
};

void Reactor::State::arm(std::uint64_t key, Watched& watched, std::uint32_t events) const {
  watched.armed = events;
  if (events == 0) return;
  epoll_event event{};
  event.events = events | static_cast<std::uint32_t>(EPOLLONESHOT);
  event.data.u64 = key;
  ::epoll_ctl(epoll.get(), EPOLL_CTL_MOD, watched.descriptor, &event);
}

void Reactor::State::rearm(std::uint64_t key, std::uint32_t events) {
  const std::lock_guard lock(mutex);
  const auto found = watches.find(key);
  if (found == watches.end()) return;
  Watched& watched = found->second;
  if (watched.running) {
    watched.wantedMeanwhile |= events;
  } else if ((watched.armed | events) != watched.armed) {
    arm(key, watched, watched.armed | events);
  }
}

void Reactor::State::drop(std::uint64_t key) {
  std::shared_ptr<Handler> released;  // after the lock: it may own registrations
  const std::lock_guard lock(mutex);
  const auto found = watches.find(key);
  if (found == watches.end()) return;
  ::epoll_ctl(epoll.get(), EPOLL_CTL_DEL, found->second.descriptor, nullptr);
  released = std::move(found->second.handler);
  watches.erase(found);
}

void Reactor::State::runHandler(std::uint64_t key, std::uint32_t events) {
  std::shared_ptr<Handler> handler;
  {
    const std::lock_guard lock(mutex);
    const auto found = watches.find(key);
    if (found == watches.end() || found->second.running || found->second.armed == 0) return;
    found->second.running = true;
    found->second.armed = 0;
    handler = found->second.handler;
  }
  const std::uint32_t wanted = (*handler)(events);
  const std::lock_guard lock(mutex);
  const auto found = watches.find(key);
  if (found == watches.end()) return;
  Watched& watched = found->second;
  watched.running = false;
  arm(key, watched, wanted | std::exchange(watched.wantedMeanwhile, 0));
}

void Reactor::State::post(std::function<void()> task) {
  {
    const std::lock_guard lock(mutex);
    if (over) return;
    tasks.push_back(std::move(task));
  }
  const std::uint64_t one = 1;
  if (::write(posted.get(), &one, sizeof one) != sizeof one) giveUp("cannot post to a reactor");
}

void Reactor::State::runTask() {
  std::uint64_t one = 0;
  if (::read(posted.get(), &one, sizeof one) != sizeof one) return;  // another thread was faster
  std::function<void()> task;
  {
    const std::lock_guard lock(mutex);
    if (tasks.empty()) return;
    task = std::move(tasks.front());
    tasks.pop_front();
  }
  task();
}

void Reactor::State::run() {
  while (true) {
    epoll_event event{};
    const int count = ::epoll_wait(epoll.get(), &event, 1, -1);
    if (count < 0 && errno != EINTR) giveUp("epoll_wait");
    if (count <= 0) continue;
    if (event.data.u64 == kStopKey) return;
    if (event.data.u64 == kPostKey) {
      runTask();
    } else {
      runHandler(event.data.u64, event.events);
    }
  }
}

Reactor::Reactor(unsigned threads) : state_(std::make_shared<State>()) {
  assert(threads > 0);
  state_->epoll = UniqueDescriptor(::epoll_create1(EPOLL_CLOEXEC));
  state_->stop = UniqueDescriptor(::eventfd(0, EFD_CLOEXEC));
  state_->posted = UniqueDescriptor(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK | EFD_SEMAPHORE));
  if (!state_->epoll || !state_->stop || !state_->posted) giveUp("cannot create a reactor");
  for (const auto& [descriptor, key] : {std::pair{state_->stop.get(), kStopKey}, std::pair{state_->posted.get(), kPostKey}}) {
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.u64 = key;
    if (::epoll_ctl(state_->epoll.get(), EPOLL_CTL_ADD, descriptor, &event) != 0) giveUp("epoll_ctl");
  }
  for (unsigned i = 0; i < threads; ++i) {
    state_->threads.emplace_back([state = state_.get()] { state->run(); });  // joined before the state goes
  }
}

Reactor::~Reactor() {
  const std::uint64_t one = 1;
  if (::write(state_->stop.get(), &one, sizeof one) != sizeof one) giveUp("cannot stop a reactor");
  for (std::thread& thread : state_->threads) thread.join();

  std::map<std::uint64_t, Watched> left;
  {
    const std::lock_guard lock(state_->mutex);
    left.swap(state_->watches);
    for (const auto& [key, watched] : left) ::epoll_ctl(state_->epoll.get(), EPOLL_CTL_DEL, watched.descriptor, nullptr);
  }
  left.clear();
  while (true) {
    std::function<void()> task;
    {
      const std::lock_guard lock(state_->mutex);
      if (state_->tasks.empty()) {
        state_->over = true;
        break;
      }
      task = std::move(state_->tasks.front());
      state_->tasks.pop_front();
    }
    task();
  }
}

std::shared_ptr<Reactor::Registration> Reactor::watch(int descriptor, std::uint32_t events, Handler handler) {
  const std::lock_guard lock(state_->mutex);
  const std::uint64_t key = state_->nextKey++;
  epoll_event event{};
  event.events = events | static_cast<std::uint32_t>(EPOLLONESHOT);
  event.data.u64 = key;
  if (::epoll_ctl(state_->epoll.get(), EPOLL_CTL_ADD, descriptor, &event) != 0) return nullptr;
  // Armed even without events: a hang-up is told.
  state_->watches.emplace(key, Watched{descriptor, std::make_shared<Handler>(std::move(handler)), events | EPOLLHUP});
  return std::make_shared<Watch>(state_, key);
}

Reactor::Poster Reactor::poster() const {
  return [state = state_](std::function<void()> task) { state->post(std::move(task)); };
}

}  // namespace docuvend::linux_platform
