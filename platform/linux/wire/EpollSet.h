// An epoll instance on which several threads wait: for watched descriptors, for posted tasks, and for the end. May be used from any thread.
#pragma once

#include <cstdint>
#include <memory>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

class EpollSet {
 public:
  // Null when the kernel has no descriptors, or no more watches for this user.
  [[nodiscard]] static std::unique_ptr<EpollSet> create();

  // Watched descriptors are told of once, then they need to be armed again. Keys are the caller's, from kFirstKey on.
  static constexpr std::uint64_t kFirstKey = 2;
  enum class Adding {
    done,
    badDescriptor,
    refused,  // the kernel watches no more of this user's, or none of this kind
  };
  [[nodiscard]] Adding add(std::uint64_t key, int descriptor, std::uint32_t events);
  void arm(std::uint64_t key, int descriptor, std::uint32_t events);
  void remove(int descriptor);

  // Ends one thread's waiting with `posted`, whether it waits already or not.
  void post();
  // Every thread's waiting ends, now and later.
  void stop();

  struct Event {
    enum class Kind { ready, posted, stopped } kind;
    std::uint64_t key = 0;  // of what is ready
    std::uint32_t events = 0;
  };
  [[nodiscard]] Event wait();

 private:
  EpollSet() = default;

  // Constant after creation.
  UniqueDescriptor epoll_;
  UniqueDescriptor stop_;
  UniqueDescriptor posted_;
};

}  // namespace docuvend::linux_platform
