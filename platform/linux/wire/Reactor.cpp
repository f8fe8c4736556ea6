#include "platform/linux/wire/Reactor.h"

#include <sys/epoll.h>

#include <cassert>
#include <condition_variable>
#include <deque>
#include <map>
#include <mutex>
#include <optional>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

#include "platform/linux/wire/EpollSet.h"
#include "platform/linux/wire/PollThread.h"

// One epoll instance, several threads that wait on it, one event at a time each.
//
// A watched descriptor is armed for one event: the thread that gets it takes the registration until its handler has returned, and arms it
// again with the handler's result and with what others asked for meanwhile. Events carry a number, not a pointer: an event of a
// registration that has been dropped in between finds nothing. Handlers are called with no lock held.
//
// A registration whose lane is busy stays taken and stands in the lane's line; whoever leaves the lane posts the first of the line as a
// task, and one that asks to be run again is posted too. Tasks and events come out of the same instance by turns: a lane, however long its
// line, never has more than one of the turns.
//
// Where the kernel gives no epoll at all, threads wait for tasks on a condition variable. What epoll does not take is watched by a thread
// that polls, and posts what is ready.

namespace docuvend::linux_platform {
namespace {

struct Ready {
  std::uint64_t key;
  std::uint32_t events;
};

struct Watched {
  int descriptor = -1;
  std::shared_ptr<Reactor::Handler> handler;
  std::shared_ptr<Reactor::Lane> lane;  // null: it is in no other's way
  bool isPolled = false;
  std::uint32_t armed = 0;
  std::uint32_t wantedMeanwhile = 0;  // asked for while it is taken
  bool isTaken = false;               // its handler runs, or is to run
};

}  // namespace

// Guarded by the reactor's mutex.
class Reactor::Lane {
 public:
  bool isBusy = false;
  std::deque<Ready> line;
};

struct Reactor::State {
  // Constant after construction.
  std::unique_ptr<EpollSet> epoll;  // null: without
  std::vector<std::thread> threads;
  bool isRunning = false;

  std::mutex mutex;  // guards the rest
  std::condition_variable changed;
  std::uint64_t nextKey = EpollSet::kFirstKey;
  std::map<std::uint64_t, Watched> watches;
  std::unique_ptr<PollThread> polling;  // made when it is needed; ends before the threads do
  std::deque<std::function<void()>> tasks;
  bool isStopping = false;
  bool over = false;

  void start(unsigned count, Waiting waiting);
  void stop();
  void runByEpoll();
  void runByCondition();
  void runPosted();
  void post(std::function<void()> task);

  void take(Ready ready);
  void runTaken(Ready ready, const std::shared_ptr<Lane>& lane);
  std::optional<std::uint64_t> watch(Watched watched, std::uint32_t events);
  void drop(std::uint64_t key);
  void rearm(std::uint64_t key, std::uint32_t events);

  // With the mutex held.
  void syncPost(std::function<void()> task);
  bool syncAdd(std::uint64_t key, Watched& watched, std::uint32_t events);
  bool syncAddPolled(std::uint64_t key, Watched& watched, std::uint32_t events);
  void syncRemove(std::uint64_t key, const Watched& watched);
  void syncArm(std::uint64_t key, Watched& watched, std::uint32_t events);
  void syncRunLater(Ready ready, const std::shared_ptr<Lane>& lane);
  void syncLeave(const std::shared_ptr<Lane>& lane);
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

bool Reactor::State::syncAdd(std::uint64_t key, Watched& watched, std::uint32_t events) {
  const auto adding = epoll ? epoll->add(key, watched.descriptor, events) : EpollSet::Adding::refused;
  return adding == EpollSet::Adding::done || (adding == EpollSet::Adding::refused && syncAddPolled(key, watched, events));
}

bool Reactor::State::syncAddPolled(std::uint64_t key, Watched& watched, std::uint32_t events) {
  if (watched.descriptor < 0 || isStopping) return false;
  if (!polling) {
    polling = PollThread::start([this](std::uint64_t ready, std::uint32_t told) { post([this, ready, told] { take({ready, told}); }); });
  }
  if (!polling) return false;
  watched.isPolled = true;
  polling->arm(key, watched.descriptor, events);
  return true;
}

void Reactor::State::syncRemove(std::uint64_t key, const Watched& watched) {
  if (!watched.isPolled) {
    epoll->remove(watched.descriptor);
  } else if (polling) {
    polling->letGo(key);
  }
}

void Reactor::State::syncArm(std::uint64_t key, Watched& watched, std::uint32_t events) {
  watched.armed = events;
  if (events == 0) return;
  if (!watched.isPolled) {
    epoll->arm(key, watched.descriptor, events);
  } else if (polling) {
    polling->arm(key, watched.descriptor, events);
  }
}

std::optional<std::uint64_t> Reactor::State::watch(Watched watched, std::uint32_t events) {
  const std::lock_guard lock(mutex);
  const std::uint64_t key = nextKey++;
  if (!syncAdd(key, watched, events)) return std::nullopt;
  watched.armed = events | EPOLLHUP;  // armed even without events: a hang-up is told
  watches.emplace(key, std::move(watched));
  return key;
}

void Reactor::State::rearm(std::uint64_t key, std::uint32_t events) {
  const std::lock_guard lock(mutex);
  const auto found = watches.find(key);
  if (found == watches.end()) return;
  Watched& watched = found->second;
  if (watched.isTaken) {
    watched.wantedMeanwhile |= events;
  } else if ((watched.armed | events) != watched.armed) {
    syncArm(key, watched, watched.armed | events);
  }
}

void Reactor::State::drop(std::uint64_t key) {
  Watched dropped;  // goes after the lock: its handler may own registrations
  const std::lock_guard lock(mutex);
  const auto found = watches.find(key);
  if (found == watches.end()) return;
  syncRemove(key, found->second);
  dropped = std::move(found->second);
  watches.erase(found);
}

void Reactor::State::take(Ready ready) {
  std::shared_ptr<Lane> lane;
  {
    const std::lock_guard lock(mutex);
    const auto found = watches.find(ready.key);
    if (found == watches.end() || found->second.isTaken || found->second.armed == 0) return;
    Watched& watched = found->second;
    watched.isTaken = true;
    watched.armed = 0;
    lane = watched.lane;
    if (lane && std::exchange(lane->isBusy, true)) {
      lane->line.push_back(ready);
      return;
    }
  }
  runTaken(ready, lane);
}

void Reactor::State::runTaken(Ready ready, const std::shared_ptr<Lane>& lane) {
  std::shared_ptr<Handler> handler;
  {
    const std::lock_guard lock(mutex);
    const auto found = watches.find(ready.key);
    if (found != watches.end()) handler = found->second.handler;
  }
  const std::uint32_t wanted = handler ? (*handler)(ready.events) : 0;
  handler.reset();
  const std::lock_guard lock(mutex);
  const auto found = watches.find(ready.key);
  if (found != watches.end()) {
    Watched& watched = found->second;
    if ((wanted & kAgain) != 0) {
      syncRunLater({ready.key, 0}, lane);
    } else {
      watched.isTaken = false;
      syncArm(ready.key, watched, wanted | std::exchange(watched.wantedMeanwhile, 0));
    }
  }
  if (lane) syncLeave(lane);
}

void Reactor::State::syncRunLater(Ready ready, const std::shared_ptr<Lane>& lane) {
  if (lane) {
    lane->line.push_back(ready);
  } else {
    syncPost([this, ready] { runTaken(ready, /*lane=*/{}); });
  }
}

// One that was dropped meanwhile is found out when its turn comes.
void Reactor::State::syncLeave(const std::shared_ptr<Lane>& lane) {
  lane->isBusy = !lane->line.empty();
  if (!lane->isBusy) return;
  const Ready next = lane->line.front();
  lane->line.pop_front();
  syncPost([this, next, lane] { runTaken(next, lane); });
}

void Reactor::State::post(std::function<void()> task) {
  const std::lock_guard lock(mutex);
  syncPost(std::move(task));
}

void Reactor::State::syncPost(std::function<void()> task) {
  if (over) return;
  tasks.push_back(std::move(task));
  if (epoll) {
    epoll->post();
  } else {
    changed.notify_one();
  }
}

void Reactor::State::runPosted() {
  std::function<void()> task;
  {
    const std::lock_guard lock(mutex);
    if (tasks.empty()) return;
    task = std::move(tasks.front());
    tasks.pop_front();
  }
  task();
}

void Reactor::State::runByEpoll() {
  while (true) {
    const auto event = epoll->wait();
    if (event.kind == EpollSet::Event::Kind::stopped) return;
    if (event.kind == EpollSet::Event::Kind::posted) {
      runPosted();
    } else {
      take({event.key, event.events});
    }
  }
}

void Reactor::State::runByCondition() {
  while (true) {
    {
      std::unique_lock lock(mutex);
      changed.wait(lock, [this] { return isStopping || !tasks.empty(); });
      if (isStopping) return;
    }
    runPosted();
  }
}

void Reactor::State::start(unsigned count, Waiting waiting) {
  if (waiting == Waiting::byEpoll) epoll = EpollSet::create();
  for (unsigned i = 0; i < count; ++i) {
    try {
      threads.emplace_back([this] { epoll ? runByEpoll() : runByCondition(); });  // joined before the state goes
    } catch (const std::system_error&) {
      return;
    }
  }
  isRunning = true;
}

void Reactor::State::stop() {
  std::unique_ptr<PollThread> ended;
  {
    const std::lock_guard lock(mutex);
    isStopping = true;
    ended.swap(polling);
  }
  ended.reset();
  changed.notify_all();
  if (epoll) epoll->stop();
  for (std::thread& thread : threads) thread.join();
}

Reactor::Reactor(unsigned threads, Waiting waiting) : state_(std::make_shared<State>()) {
  assert(threads > 0);
  state_->start(threads, waiting);
}

Reactor::~Reactor() {
  state_->stop();

  std::map<std::uint64_t, Watched> left;
  {
    const std::lock_guard lock(state_->mutex);
    left.swap(state_->watches);
    for (const auto& [key, watched] : left) state_->syncRemove(key, watched);
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

bool Reactor::isRunning() const { return state_->isRunning; }

std::shared_ptr<Reactor::Lane> Reactor::makeLane() { return std::make_shared<Lane>(); }

std::shared_ptr<Reactor::Registration> Reactor::watch(int descriptor, std::uint32_t events, Handler handler, std::shared_ptr<Lane> lane) {
  const std::optional<std::uint64_t> key =
      state_->watch({descriptor, std::make_shared<Handler>(std::move(handler)), std::move(lane)}, events);
  if (!key) return nullptr;
  return std::make_shared<Watch>(state_, *key);
}

Reactor::Poster Reactor::poster() const {
  return [state = state_](std::function<void()> task) { state->post(std::move(task)); };
}

}  // namespace docuvend::linux_platform
