// Notifications that a test posts.
//
// Differs from the real one: nothing comes from other processes. Callbacks run on the run loop given here, so a test decides when.
// May be used from any thread; the run loop must outlive it.
#pragma once

#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "platform/notification_center.h"
#include "platform/queue.h"

namespace docuvend::fake_platform {

class FakeNotificationCenter : public QXNotificationCenter {
 public:
  struct Observer {
    std::string notification;
    QXSuspensionBehavior behavior;
    std::function<void()> callback;
  };

  explicit FakeNotificationCenter(QXRunLoop& runLoop) : runLoop_(runLoop) {}

  void addObserver(const std::string& notification, std::function<void()> callback, QXSuspensionBehavior behavior) override;

  // Hands each observer's callback to the run loop, in the order of their registration.
  void post(const std::string& notification) override;
  // Everybody who was ever registered, in order.
  [[nodiscard]] std::vector<Observer> observers() const;

 private:
  QXRunLoop& runLoop_;

  mutable std::mutex mutex_;
  std::vector<Observer> observers_;  // guarded by mutex_
};

}  // namespace docuvend::fake_platform
