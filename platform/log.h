// The system log.
#pragma once

#include <string>

namespace docuvend {

// Default is always written; info and debug when the platform's log setting says so; fault always.
enum class QXLogType { defaultType, info, debug, fault };

class QXLogHandle {
 public:
  QXLogHandle() = default;
  QXLogHandle(const QXLogHandle&) = delete;
  QXLogHandle& operator=(const QXLogHandle&) = delete;
  virtual ~QXLogHandle() = default;

  [[nodiscard]] virtual bool isEnabled(QXLogType type) const = 0;
  // Writes one entry. May be called from any thread. Control characters in the text cannot start a new line or disturb a terminal.
  virtual void write(QXLogType type, const std::string& message) = 0;
};

class QXLogService {
 public:
  QXLogService() = default;
  QXLogService(const QXLogService&) = delete;
  QXLogService& operator=(const QXLogService&) = delete;
  virtual ~QXLogService() = default;

  [[nodiscard]] virtual QXLogHandle& defaultLog() = 0;
};

}  // namespace docuvend
