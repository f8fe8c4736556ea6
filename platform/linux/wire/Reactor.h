// A few threads that wait for sockets and run what their readiness asks for.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>

namespace docuvend::linux_platform {

class Reactor {
 public:
  // `threads` at least 1.
  explicit Reactor(unsigned threads);
  // Waits for the handlers that run. Not to be called from a handler.
  ~Reactor();
  Reactor(const Reactor&) = delete;
  Reactor& operator=(const Reactor&) = delete;

  // Watches a descriptor until the registration is dropped. The handler runs on a thread of the reactor, never twice at a time for one
  // registration; `events` are epoll's. Its result says which events to wait for next (0: none until `rearm`).
  class Registration {
   public:
    virtual ~Registration() = default;
    virtual void rearm(std::uint32_t events) = 0;
  };
  using Handler = std::function<std::uint32_t(std::uint32_t events)>;
  [[nodiscard]] std::shared_ptr<Registration> watch(int descriptor, std::uint32_t events, Handler handler);

 private:
  struct State;
  std::shared_ptr<State> state_;
};

}  // namespace docuvend::linux_platform
