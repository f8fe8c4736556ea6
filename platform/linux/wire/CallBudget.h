// How many requests may be without an answer at once, and how many bytes of them. Whoever holds the same budget shares it, and a budget may
// lie within another one: what is taken from it is taken from both. A request that finds no other is let in whatever its length, which the
// frame's limit bounds. May be used from any thread.
#pragma once

#include <cstddef>
#include <memory>
#include <mutex>
#include <utility>

namespace docuvend::linux_platform {

struct CallLimits {
  std::size_t calls;
  std::size_t bytes;
};

class CallBudget : public std::enable_shared_from_this<CallBudget> {
 public:
  // One request's share; dropping it gives it back. Keeps the budget alive.
  class Share {
   public:
    Share(std::shared_ptr<CallBudget> budget, std::size_t bytes, std::unique_ptr<Share> ofEnclosing)
        : budget_(std::move(budget)), bytes_(bytes), ofEnclosing_(std::move(ofEnclosing)) {}
    Share(const Share&) = delete;
    Share& operator=(const Share&) = delete;
    ~Share() { budget_->giveBack(bytes_); }

   private:
    const std::shared_ptr<CallBudget> budget_;
    const std::size_t bytes_;
    const std::unique_ptr<Share> ofEnclosing_;
  };

  // `enclosing` is empty for a budget that lies within no other.
  explicit CallBudget(CallLimits limits, std::shared_ptr<CallBudget> enclosing = {}) : limits_(limits), enclosing_(std::move(enclosing)) {}

  // None when this budget or one around it has no room for a request of that length.
  [[nodiscard]] std::unique_ptr<Share> take(std::size_t bytes);

 private:
  void giveBack(std::size_t bytes);

  // Constant after construction.
  const CallLimits limits_;
  const std::shared_ptr<CallBudget> enclosing_;

  std::mutex mutex_;  // held while that of the enclosing budget is taken
  CallLimits taken_{};
};

}  // namespace docuvend::linux_platform
