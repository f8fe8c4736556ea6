// Tells somebody who has just forbidden something when all of it that had begun before is over. What begins later does not delay him,
// so nobody can put him off for ever by doing it again and again. May be used from any thread.
#pragma once

#include <array>
#include <condition_variable>
#include <cstddef>
#include <mutex>
#include <utility>

namespace docuvend::linux_platform {

class UsesInFlight {
 public:
  // One use, from `begin` until the object goes. Does not outlive the counter.
  class Use {
   public:
    Use(Use&& other) noexcept : owner_(std::exchange(other.owner_, nullptr)), round_(other.round_) {}
    Use& operator=(Use&&) = delete;
    ~Use() {
      if (owner_ != nullptr) owner_->end(round_);
    }

   private:
    friend class UsesInFlight;
    Use(UsesInFlight& owner, std::size_t round) : owner_(&owner), round_(round) {}

    UsesInFlight* owner_;
    std::size_t round_;
  };

  [[nodiscard]] Use begin();
  // Returns when every use that had begun when this was called has ended. Not from within a use.
  void waitForEarlier();

 private:
  void end(std::size_t round);

  std::mutex waiting_;  // held by the one who waits
  std::mutex mutex_;
  std::condition_variable over_;
  // Guarded by mutex_. Uses are counted for the round in which they began; there is one that begins, and at most one that ends.
  std::size_t round_ = 0;
  std::array<std::size_t, 2> counts_{};
};

}  // namespace docuvend::linux_platform
