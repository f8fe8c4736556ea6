// One list per queue and one submission counter over all of them. A task may run when its queue is not suspended, it stands in front
// (on a concurrent queue: no barrier stands before it), and no running task excludes it. Tasks that run are nested in one another on
// the one thread, so a `sync` that cannot go on now never will, unless a suspended queue is resumed by a task that waits elsewhere.
//
// `context` is the chain of tasks that the contract calls current: a task entered by `sync` adds itself to the chain of its caller; a
// task that is merely turned, be it inside another one's `sync`, starts a chain of its own.
#include "platform/fake/FakeQueues.h"

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <deque>
#include <map>
#include <thread>
#include <utility>

namespace docuvend::fake_platform {
namespace {

constexpr std::size_t kMaxTurns = 1'000'000;

enum class Kind { serial, concurrent, operations };
enum class Access { shared, exclusive };

void check(bool holds, const char* why, const std::string& label) {
  if (holds) return;
  std::fprintf(stderr, "FakeQueues: %s: %s\n", label.c_str(), why);
  std::abort();
}

struct Entry {
  std::uint64_t number;
  Access access;
  QXTask task;
};

struct State {
  std::string label;
  Kind kind;
  std::deque<Entry> entries = {};
  std::size_t suspended = 0;
  std::size_t runningShared = 0;
  std::size_t runningExclusive = 0;
  bool released = false;

  // The entry in front when it may run now. Of a concurrent queue no reader may pass a barrier, so that is always the first.
  [[nodiscard]] bool frontMayRun() const { return !entries.empty() && suspended == 0 && admits(entries.front().access); }
  [[nodiscard]] bool admits(Access access) const {
    if (kind == Kind::operations) return true;
    return runningExclusive == 0 && (access == Access::shared || runningShared == 0);
  }
};

}  // namespace

class FakeQueues::Core {
 public:
  std::shared_ptr<State> add(std::string label, Kind kind) {
    checkThread();
    states_.push_back(std::make_shared<State>(State{std::move(label), kind}));
    return states_.back();
  }

  void release(const std::shared_ptr<State>& state) {
    state->released = true;
    if (state->suspended > 0) {
      const std::deque<Entry> never = std::exchange(state->entries, {});
    }
    forgetReleased();
  }

  void submit(State& state, Access access, QXTask task) {
    checkThread();
    if (closed_) return;
    state.entries.push_back({++submissions_, state.kind == Kind::serial ? Access::exclusive : access, std::move(task)});
  }

  void submitLater(const std::shared_ptr<State>& state, std::chrono::nanoseconds delay, QXTask task) {
    checkThread();
    if (closed_) return;
    timers_.emplace(now_ + std::max(delay, std::chrono::nanoseconds::zero()), Timer{state, std::move(task)});
  }

  void sync(State& state, const QXTask& task) {
    checkThread();
    const Access access = state.kind == Kind::serial ? Access::exclusive : Access::shared;
    if (state.kind != Kind::operations) check(!isCurrent(state), "sync from a task of the queue itself", state.label);
    const std::uint64_t number = ++submissions_;
    for (std::size_t turns = 0; !mayEnter(state, access, number); ++turns) {
      check(turns < kMaxTurns, "sync sees no end", state.label);
      const bool ownFirst = hasBefore(state, number) && state.frontMayRun();
      if (ownFirst) {
        runFront(state);
      } else {
        check(state.suspended > 0 && runOneOf([](const State&) { return true; }), "sync would wait for ever", state.label);
      }
    }
    context_.push_back(&state);
    run(state, access, task);
    context_.pop_back();
  }

  bool runOneOf(const std::function<bool(const State&)>& isMeant) {
    checkThread();
    std::shared_ptr<State> oldest;
    for (const auto& state : states_) {
      if (!isMeant(*state) || !state->frontMayRun()) continue;
      if (!oldest || state->entries.front().number < oldest->entries.front().number) oldest = state;
    }
    if (!oldest) return false;
    runFront(*oldest);
    forgetReleased();
    return true;
  }

  void advance(std::chrono::nanoseconds duration) {
    checkThread();
    now_ += duration;
    while (!timers_.empty() && timers_.begin()->first <= now_) {
      auto due = timers_.extract(timers_.begin());
      // A queue that has been released is still known while a timer holds it.
      submit(*due.mapped().state, Access::shared, std::move(due.mapped().task));
    }
  }

  void close() {
    closed_ = true;
    // The tasks may own queues, and so call back into here while they are destroyed.
    std::vector<std::deque<Entry>> entries;
    for (const auto& state : states_) entries.push_back(std::exchange(state->entries, {}));
    const auto timers = std::exchange(timers_, {});
  }

  [[nodiscard]] bool isCurrent(const State& state) const { return std::find(context_.begin(), context_.end(), &state) != context_.end(); }
  [[nodiscard]] std::string currentLabel() const { return context_.empty() ? std::string() : context_.back()->label; }
  [[nodiscard]] std::size_t timers() const { return timers_.size(); }

  [[nodiscard]] std::size_t count(const std::function<std::size_t(const State&)>& ofState) const {
    std::size_t sum = 0;
    for (const auto& state : states_) sum += ofState(*state);
    return sum;
  }

  std::vector<FakeCreatedQueue> createdQueues;
  std::size_t runLoopRuns = 0;

 private:
  struct Timer {
    std::shared_ptr<State> state;
    QXTask task;
  };

  void checkThread() const { check(std::this_thread::get_id() == thread_, "used from two threads", "all queues"); }

  static bool hasBefore(const State& state, std::uint64_t number) {
    return !state.entries.empty() && state.entries.front().number < number;
  }
  static bool mayEnter(const State& state, Access access, std::uint64_t number) {
    return state.suspended == 0 && !hasBefore(state, number) && state.admits(access);
  }

  void runFront(State& state) {
    Entry entry = std::move(state.entries.front());
    state.entries.pop_front();
    std::vector<const State*> callers = std::exchange(context_, {&state});
    run(state, entry.access, [&entry] {
      entry.task();
      entry.task = {};  // what the task held is released as part of the task
    });
    context_ = std::move(callers);
  }

  static void run(State& state, Access access, const QXTask& task) {
    std::size_t& running = access == Access::shared ? state.runningShared : state.runningExclusive;
    ++running;
    task();
    --running;
  }

  void forgetReleased() {
    std::erase_if(states_,
                  [](const std::shared_ptr<State>& state) { return state->released && state->entries.empty() && state.use_count() == 1; });
  }

  const std::thread::id thread_ = std::this_thread::get_id();
  std::vector<std::shared_ptr<State>> states_;
  std::multimap<std::chrono::nanoseconds, Timer> timers_;  // of equal times the first submitted first
  std::vector<const State*> context_;
  std::chrono::nanoseconds now_{0};
  std::uint64_t submissions_ = 0;
  bool closed_ = false;
};

class FakeQueues::Queue final : public QXQueue {
 public:
  Queue(std::shared_ptr<Core> core, std::shared_ptr<State> state) : core_(std::move(core)), state_(std::move(state)) {}
  ~Queue() override {
    const std::shared_ptr<State> state = std::move(state_);
    core_->release(state);
  }

  [[nodiscard]] const std::string& label() const override { return state_->label; }
  void async(QXTask task) override { core_->submit(*state_, Access::shared, std::move(task)); }
  void sync(const QXTask& task) override {
    const std::shared_ptr<State> state = state_;  // the queue may be released inside the task
    core_->sync(*state, task);
  }
  void barrierAsync(QXTask task) override { core_->submit(*state_, Access::exclusive, std::move(task)); }
  void after(std::chrono::nanoseconds delay, QXTask task) override { core_->submitLater(state_, delay, std::move(task)); }
  void suspend() override {
    checkIsNotGlobal();
    ++state_->suspended;
  }
  void resume() override {
    checkIsNotGlobal();
    check(state_->suspended > 0, "one resume too many", state_->label);
    --state_->suspended;
  }
  [[nodiscard]] bool isCurrent() const override { return core_->isCurrent(*state_); }

 private:
  void checkIsNotGlobal() const { check(state_->kind != Kind::operations, "cannot be suspended", state_->label); }

  std::shared_ptr<Core> core_;
  std::shared_ptr<State> state_;
};

class FakeQueues::Operations final : public QXOperationQueue {
 public:
  Operations(std::shared_ptr<Core> core, std::shared_ptr<State> state) : core_(std::move(core)), state_(std::move(state)) {}
  ~Operations() override {
    const std::shared_ptr<State> state = std::move(state_);
    core_->release(state);
  }

  void setName(std::string name) override { state_->label = std::move(name); }
  [[nodiscard]] std::string name() const override { return state_->label; }
  void addOperation(QXTask operation) override { core_->submit(*state_, Access::shared, std::move(operation)); }

 private:
  std::shared_ptr<Core> core_;
  std::shared_ptr<State> state_;
};

class FakeQueues::RunLoop final : public QXRunLoop {
 public:
  RunLoop(std::shared_ptr<Core> core, std::shared_ptr<State> state) : core_(std::move(core)), state_(std::move(state)) {}

  void run() override { ++core_->runLoopRuns; }
  void perform(QXTask task) override { core_->submit(*state_, Access::exclusive, std::move(task)); }

 private:
  std::shared_ptr<Core> core_;
  std::shared_ptr<State> state_;
};

FakeQueues::FakeQueues()
    : core_(std::make_shared<Core>()),
      globalQueue_(std::make_unique<Queue>(core_, core_->add(kFakeGlobalQueueLabel, Kind::operations))),
      mainRunLoop_(std::make_unique<RunLoop>(core_, core_->add(kFakeMainRunLoopLabel, Kind::serial))) {}

FakeQueues::~FakeQueues() { core_->close(); }

std::shared_ptr<QXQueue> FakeQueues::serialQueue(std::string label) {
  core_->createdQueues.push_back({FakeQueueKind::serial, label});
  return std::make_shared<Queue>(core_, core_->add(std::move(label), Kind::serial));
}

std::shared_ptr<QXQueue> FakeQueues::concurrentQueue(std::string label) {
  core_->createdQueues.push_back({FakeQueueKind::concurrent, label});
  return std::make_shared<Queue>(core_, core_->add(std::move(label), Kind::concurrent));
}

QXQueue& FakeQueues::globalQueue() { return *globalQueue_; }

std::shared_ptr<QXOperationQueue> FakeQueues::operationQueue() {
  return std::make_shared<Operations>(core_, core_->add("", Kind::operations));
}

QXRunLoop& FakeQueues::mainRunLoop() { return *mainRunLoop_; }

bool FakeQueues::runOne() {
  return core_->runOneOf([](const State&) { return true; });
}

bool FakeQueues::runOne(std::string_view label) {
  return core_->runOneOf([label](const State& state) { return state.label == label; });
}

std::size_t FakeQueues::runAll() {
  std::size_t turns = 0;
  while (runOne()) check(++turns < kMaxTurns, "runAll sees no end", "all queues");
  return turns;
}

void FakeQueues::advance(std::chrono::nanoseconds duration) { core_->advance(duration); }

std::size_t FakeQueues::pending() const {
  return core_->count([](const State& state) { return state.entries.size(); });
}

std::size_t FakeQueues::pending(std::string_view label) const {
  return core_->count([label](const State& state) { return state.label == label ? state.entries.size() : 0; });
}

std::size_t FakeQueues::pendingOperations() const {
  return core_->count(
      [](const State& state) { return state.kind == Kind::operations && state.label != kFakeGlobalQueueLabel ? state.entries.size() : 0; });
}

std::size_t FakeQueues::pendingTimers() const { return core_->timers(); }

std::size_t FakeQueues::suspendedCount(std::string_view label) const {
  return core_->count([label](const State& state) { return state.label == label ? state.suspended : 0; });
}

std::vector<FakeCreatedQueue> FakeQueues::createdQueues() const { return core_->createdQueues; }

std::string FakeQueues::currentLabel() const { return core_->currentLabel(); }

std::size_t FakeQueues::runLoopRuns() const { return core_->runLoopRuns; }

}  // namespace docuvend::fake_platform
