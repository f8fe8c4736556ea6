#include "platform/fake/FakeFileCoordinator.h"

#include <algorithm>

namespace docuvend::fake_platform {

std::vector<FakeFileCoordinator::Call> FakeFileCoordinator::calls() const {
  const std::lock_guard lock(mutex_);
  return calls_;
}

std::vector<std::shared_ptr<QXDocuvend>> FakeFileCoordinator::providers() const {
  const std::lock_guard lock(mutex_);
  return providers_;
}

void FakeFileCoordinator::_addDocuvend(std::shared_ptr<QXDocuvend> provider) {
  const std::lock_guard lock(mutex_);
  calls_.push_back({Action::add, provider});
  providers_.push_back(std::move(provider));
}

void FakeFileCoordinator::_removeDocuvend(const std::shared_ptr<QXDocuvend>& provider) {
  const std::lock_guard lock(mutex_);
  calls_.push_back({Action::remove, provider});
  const auto found = std::find(providers_.begin(), providers_.end(), provider);
  if (found != providers_.end()) providers_.erase(found);
}

}  // namespace docuvend::fake_platform
