// Notifications to this process. Whoever receives one from outside posts it here.
//
// Each post calls every observer of that name once, on the run loop given here, in the order of their registration and of the posts of one
// thread. An observer that is added later does not see it. May be used from any thread; the run loop must outlive it.
#pragma once

#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "platform/notification_center.h"
#include "platform/queue.h"

namespace docuvend::linux_platform {

class LinuxNotificationCenter : public QXNotificationCenter {
 public:
  explicit LinuxNotificationCenter(QXRunLoop& runLoop) : runLoop_(runLoop) {}

  void addObserver(const std::string& notification, std::function<void()> callback, QXSuspensionBehavior behavior) override;
  void post(const std::string& notification) override;

 private:
  struct Observer {
    std::string notification;
    std::function<void()> callback;
  };

  [[nodiscard]] std::vector<std::function<void()>> callbacksFor(const std::string& notification) const;

  QXRunLoop& runLoop_;

  mutable std::mutex mutex_;
  std::vector<Observer> observers_;  // guarded by mutex_
};

}  // namespace docuvend::linux_platform
