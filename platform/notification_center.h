// System-wide notifications between processes.
#pragma once

#include <functional>
#include <string>

namespace docuvend {

inline constexpr const char* kQXFirstUnlockNotification = "com.orvane.mobile.gatewardd.first_unlock";

// When a notification reaches an observer; the values are the platform's.
enum class QXSuspensionBehavior { deliverImmediately = 4 };

class QXNotificationCenter {
 public:
  QXNotificationCenter() = default;
  QXNotificationCenter(const QXNotificationCenter&) = delete;
  QXNotificationCenter& operator=(const QXNotificationCenter&) = delete;
  virtual ~QXNotificationCenter() = default;

  // Calls back on the main run loop each time the notification is posted, for the life of the process.
  virtual void addObserver(const std::string& notification, std::function<void()> callback, QXSuspensionBehavior behavior) = 0;

  // Calls every observer of that name once, each on the main run loop, later. May be called from any thread. Whoever hears of an event of
  // the system from outside posts it.
  virtual void post(const std::string& notification) = 0;
};

}  // namespace docuvend
