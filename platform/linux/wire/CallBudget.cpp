#include "platform/linux/wire/CallBudget.h"

namespace docuvend::linux_platform {

std::unique_ptr<CallBudget::Share> CallBudget::take(std::size_t bytes) {
  const std::lock_guard lock(mutex_);
  if (taken_.calls >= limits_.calls || (taken_.calls > 0 && taken_.bytes + bytes > limits_.bytes)) return nullptr;
  std::unique_ptr<Share> ofEnclosing;
  if (enclosing_) {
    ofEnclosing = enclosing_->take(bytes);
    if (!ofEnclosing) return nullptr;
  }
  ++taken_.calls;
  taken_.bytes += bytes;
  return std::make_unique<Share>(shared_from_this(), bytes, std::move(ofEnclosing));
}

void CallBudget::giveBack(std::size_t bytes) {
  const std::lock_guard lock(mutex_);
  --taken_.calls;
  taken_.bytes -= bytes;
}

}  // namespace docuvend::linux_platform
