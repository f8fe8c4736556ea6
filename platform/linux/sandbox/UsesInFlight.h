// Tells somebody who has just forbidden something below a directory when all of it that had begun before is over. What begins later does
// not delay him, so nobody can put him off by doing it again and again; nor does what is done elsewhere. May be used from any thread.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <map>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

namespace docuvend::linux_platform {

class UsesInFlight {
 public:
  // One use, from `begin` until the object goes. Does not outlive the counter.
  class Use {
   public:
    Use(Use&& other) noexcept : owner_(std::exchange(other.owner_, nullptr)), number_(other.number_) {}
    Use& operator=(Use&&) = delete;
    ~Use() {
      if (owner_ != nullptr) owner_->end(number_);
    }

   private:
    friend class UsesInFlight;
    Use(UsesInFlight& owner, std::uint64_t number) : owner_(&owner), number_(number) {}

    UsesInFlight* owner_;
    std::uint64_t number_;
  };

  // Of the file at that path, which is absolute.
  [[nodiscard]] Use begin(std::string path);

  // Returns when every use that had begun when this was called, of a file below one of the directories, has ended, or when that takes
  // longer. The paths of those that have not ended, the oldest first. The directories have a final slash. Not from within a use.
  [[nodiscard]] std::vector<std::string> waitForEarlier(const std::vector<std::string>& directories, std::chrono::milliseconds atMost);

 private:
  using Paths = std::map<std::uint64_t, std::string>;

  void end(std::uint64_t number);

  std::mutex mutex_;
  std::condition_variable over_;
  // Guarded by mutex_.
  Paths uses_;  // by their number, in which they began
  std::uint64_t next_ = 0;
};

}  // namespace docuvend::linux_platform
