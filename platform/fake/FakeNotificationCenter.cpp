#include "platform/fake/FakeNotificationCenter.h"

#include <utility>

namespace docuvend::fake_platform {

void FakeNotificationCenter::addObserver(const std::string& notification, std::function<void()> callback, QXSuspensionBehavior behavior) {
  const std::lock_guard lock(mutex_);
  observers_.push_back({notification, behavior, std::move(callback)});
}

void FakeNotificationCenter::post(const std::string& notification) {
  for (const Observer& observer : observers()) {
    if (observer.notification == notification) runLoop_.perform(observer.callback);
  }
}

std::vector<FakeNotificationCenter::Observer> FakeNotificationCenter::observers() const {
  const std::lock_guard lock(mutex_);
  return observers_;
}

}  // namespace docuvend::fake_platform
