#include "platform/linux/files/LinuxNotificationCenter.h"

#include <utility>

namespace docuvend::linux_platform {

// This process is never suspended by the platform, so there is one way to deliver.
void LinuxNotificationCenter::addObserver(const std::string& notification, std::function<void()> callback, QXSuspensionBehavior) {
  const std::lock_guard lock(mutex_);
  observers_.push_back({notification, std::move(callback)});
}

void LinuxNotificationCenter::post(const std::string& notification) {
  for (auto& callback : callbacksFor(notification)) runLoop_.perform(std::move(callback));
}

std::vector<std::function<void()>> LinuxNotificationCenter::callbacksFor(const std::string& notification) const {
  const std::lock_guard lock(mutex_);
  std::vector<std::function<void()>> callbacks;
  for (const Observer& observer : observers_) {
    if (observer.notification == notification) callbacks.push_back(observer.callback);
  }
  return callbacks;
}

}  // namespace docuvend::linux_platform
