#include "platform/linux/wire/CallBudget.h"

namespace docuvend::linux_platform {

std::unique_ptr<CallBudget::Share> CallBudget::take() {
  const std::lock_guard lock(mutex_);
  if (taken_ >= limit_) return nullptr;
  std::unique_ptr<Share> ofEnclosing;
  if (enclosing_) {
    ofEnclosing = enclosing_->take();
    if (!ofEnclosing) return nullptr;
  }
  ++taken_;
  return std::make_unique<Share>(shared_from_this(), std::move(ofEnclosing));
}

void CallBudget::giveBack() {
  const std::lock_guard lock(mutex_);
  --taken_;
}

}  // namespace docuvend::linux_platform
