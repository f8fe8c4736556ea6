// How many requests may be without an answer at once. Whoever holds the same budget shares it, and a budget may lie within another one:
// what is taken from it is taken from both. May be used from any thread.
#pragma once

#include <cstddef>
#include <memory>
#include <mutex>
#include <utility>

namespace docuvend::linux_platform {

class CallBudget : public std::enable_shared_from_this<CallBudget> {
 public:
  // One request's share; dropping it gives it back. Keeps the budget alive.
  class Share {
   public:
    Share(std::shared_ptr<CallBudget> budget, std::unique_ptr<Share> ofEnclosing)
        : budget_(std::move(budget)), ofEnclosing_(std::move(ofEnclosing)) {}
    Share(const Share&) = delete;
    Share& operator=(const Share&) = delete;
    ~Share() { budget_->giveBack(); }

   private:
    const std::shared_ptr<CallBudget> budget_;
    const std::unique_ptr<Share> ofEnclosing_;
  };

  // `enclosing` is empty for a budget that lies within no other.
  explicit CallBudget(std::size_t limit, std::shared_ptr<CallBudget> enclosing = {}) : limit_(limit), enclosing_(std::move(enclosing)) {}

  // None when this budget or one around it is used up.
  [[nodiscard]] std::unique_ptr<Share> take();

 private:
  void giveBack();

  // Constant after construction.
  const std::size_t limit_;
  const std::shared_ptr<CallBudget> enclosing_;

  std::mutex mutex_;  // held while that of the enclosing budget is taken
  std::size_t taken_ = 0;
};

}  // namespace docuvend::linux_platform
