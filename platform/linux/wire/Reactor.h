// A few threads that wait for sockets and run what their readiness asks for.
//
// A thread of the reactor is whatever runs a handler: a handler may take its time, and costs the others nothing while threads are left.
// Who must not take all of them is given a lane.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <utility>

namespace docuvend::linux_platform {

class Reactor {
 public:
  // Without epoll every descriptor is waited for by poll(2), on one thread for all of them.
  enum class Waiting { byEpoll, byPollAlone };

  // `threads` at least 1. It does without epoll where the kernel has none to give: how many descriptors are watched so is limited for all
  // processes of a user together.
  explicit Reactor(unsigned threads, Waiting waiting = Waiting::byEpoll);
  // Waits for the handlers that run; then drops the handlers of registrations that are left, and runs what was posted.
  // Not to be called from a handler.
  ~Reactor();
  Reactor(const Reactor&) = delete;
  Reactor& operator=(const Reactor&) = delete;

  // False when the system did not give all the threads. With none at all, nothing that is watched or posted runs before the end.
  [[nodiscard]] bool isRunning() const;

  // Handlers of registrations in the same lane run one at a time, in the order in which they became ready. One of them must not wait for
  // another. May be kept longer than the reactor, and belongs to one.
  class Lane;
  [[nodiscard]] static std::shared_ptr<Lane> makeLane();

  // Watches a descriptor until the registration is dropped. The handler runs on a thread of the reactor, never twice at a time for one
  // registration; `events` are epoll's. Its result says which events to wait for next (0: none until `rearm`); hang-up and failure are
  // told with any of them. A handler that runs while its registration is dropped runs to its end: it must hold what it needs.
  class Registration {
   public:
    virtual ~Registration() = default;
    // Waits for these events too; from any thread.
    virtual void rearm(std::uint32_t events) = 0;
  };
  using Handler = std::function<std::uint32_t(std::uint32_t events)>;
  // In a handler's result, whatever else is in it: to be run again, with no events, after those who wait for a thread now.
  static constexpr std::uint32_t kAgain = 1U << 16U;  // none of epoll's
  // Null when the kernel refuses. The descriptor must stay open until the registration is dropped. The handler may run before this returns.
  // An empty lane is one of its own.
  [[nodiscard]] std::shared_ptr<Registration> watch(int descriptor, std::uint32_t events, Handler handler, std::shared_ptr<Lane> lane = {});

  // Runs the task on a thread of the reactor, not inside this call. Tasks may overlap. May be called from any thread.
  void post(std::function<void()> task) { poster()(std::move(task)); }
  // `post` as a value that may be kept longer than the reactor: tasks given to it then are dropped.
  using Poster = std::function<void(std::function<void()> task)>;
  [[nodiscard]] Poster poster() const;

 private:
  struct State;
  class Watch;
  std::shared_ptr<State> state_;
};

}  // namespace docuvend::linux_platform
