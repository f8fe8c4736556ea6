// A few threads that wait for sockets and run what their readiness asks for.
//
// A thread of the reactor is whatever runs a handler: a handler may take its time, and costs the others nothing while threads are left.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <utility>

namespace docuvend::linux_platform {

class Reactor {
 public:
  // `threads` at least 1. Ends the process when the kernel gives no descriptors: nothing works without it.
  explicit Reactor(unsigned threads);
  // Waits for the handlers that run; then drops the handlers of registrations that are left, and runs what was posted.
  // Not to be called from a handler.
  ~Reactor();
  Reactor(const Reactor&) = delete;
  Reactor& operator=(const Reactor&) = delete;

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
  // Null when the kernel refuses. The descriptor must stay open until the registration is dropped. The handler may run before this returns.
  [[nodiscard]] std::shared_ptr<Registration> watch(int descriptor, std::uint32_t events, Handler handler);

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
