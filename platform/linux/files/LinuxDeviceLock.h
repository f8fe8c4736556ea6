// The device's lock as the platform's state file tells it. The file is read anew for every question.
//
// The file: the lock state in decimal, a line feed, "1" or "0" (unlocked since boot or not), a line feed. A file that is missing, is no
// regular file, belongs to somebody else or says anything else stands for a machine without lock protection. May be used from any thread.
#pragma once

#include <optional>
#include <string>

#include "platform/QXError.h"
#include "platform/device_lock.h"
#include "platform/linux/base/Paths.h"

namespace docuvend::linux_platform {

struct LockState {
  int state = kQXLockStateUnprotected;
  bool unlockedSinceBoot = true;

  friend bool operator==(const LockState&, const LockState&) = default;
};

// What the file says; none when it says nothing that counts.
[[nodiscard]] std::optional<LockState> readLockState(const std::string& path);
// Replaces the file. The state is from 0 to 999.
[[nodiscard]] std::optional<QXError> writeLockState(const std::string& path, const LockState& state);

class LinuxDeviceLock : public QXDeviceLock {
 public:
  explicit LinuxDeviceLock(const Paths& paths) : path_(paths.lockState) {}

  int lockState() override { return readLockState(path_).value_or(LockState{}).state; }
  bool unlockedSinceBoot() override { return readLockState(path_).value_or(LockState{}).unlockedSinceBoot; }

 private:
  const std::string path_;
};

}  // namespace docuvend::linux_platform
