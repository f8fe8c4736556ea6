// A thread that waits for descriptors by poll(2), for which the kernel needs to keep nothing: for those that epoll does not take.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <thread>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

class PollThread {
 public:
  using Ready = std::function<void(std::uint64_t key, std::uint32_t events)>;

  // Null when the system gives no thread or no descriptor. `ready` is called on the thread, with no lock held; perhaps once more for a key
  // that is let go at that moment.
  [[nodiscard]] static std::unique_ptr<PollThread> start(Ready ready);
  // Not on its own thread.
  ~PollThread();
  PollThread(const PollThread&) = delete;
  PollThread& operator=(const PollThread&) = delete;

  // Waits for these events, or for a hang-up or failure, and tells of them once. Takes the place of what the key stood for before.
  void arm(std::uint64_t key, int descriptor, std::uint32_t events);
  void letGo(std::uint64_t key);

 private:
  struct Armed {
    int descriptor;
    std::uint32_t events;
  };
  PollThread(Ready ready, UniqueDescriptor wakeUp);
  void run();
  void interrupt() const;

  // Constant after construction.
  const Ready ready_;
  const UniqueDescriptor wakeUp_;
  std::thread thread_;

  std::mutex mutex_;  // guards the rest
  std::map<std::uint64_t, Armed> armed_;
  bool over_ = false;
};

}  // namespace docuvend::linux_platform
