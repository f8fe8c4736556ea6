// Whether the user's data can be read yet.
#pragma once

namespace docuvend {

// The state of a device without lock protection: there is no first unlock to wait for.
inline constexpr int kQXLockStateUnprotected = 3;

class QXDeviceLock {
 public:
  QXDeviceLock() = default;
  QXDeviceLock(const QXDeviceLock&) = delete;
  QXDeviceLock& operator=(const QXDeviceLock&) = delete;
  virtual ~QXDeviceLock() = default;

  [[nodiscard]] virtual int lockState() = 0;
  [[nodiscard]] virtual bool unlockedSinceBoot() = 0;
};

}  // namespace docuvend
