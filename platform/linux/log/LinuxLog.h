// The log service on Linux: lines on standard error, or entries in the journal when the service manager has connected standard error to it.
//
// The log setting is the environment variable DOCUVEND_LOG, read once: "info" switches on the info type, "debug" info and debug; else
// neither is on. Default and fault are always on; of these, no subject's lines (LogSubject) are more than its allowance. Whoever switches
// on the others wants all of them.
#pragma once

#include <chrono>
#include <functional>
#include <mutex>
#include <optional>
#include <string>

#include "platform/QXLogMessage.h"
#include "platform/linux/log/LogAllowance.h"
#include "platform/linux/log/LogSink.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

struct LinuxLogOptions {
  std::string identifier;                    // the program's name
  std::optional<std::string> setting;        // DOCUVEND_LOG
  std::optional<std::string> journalStream;  // JOURNAL_STREAM, "device:inode" of the stream that leads to the journal
  std::string journalSocketPath = "/run/systemd/journal/socket";
  int streamDescriptor = 2;                                                   // outlives the log
  std::function<LogAllowance::Time()> now = &std::chrono::steady_clock::now;  // may be asked from any thread

  [[nodiscard]] static LinuxLogOptions fromEnvironment(std::string identifier);
};

// May be used from any thread. An entry that the journal does not take goes to the stream; one that the stream does not take is lost.
class LinuxLog final : public QXLogService {
 public:
  explicit LinuxLog(const LinuxLogOptions& options);

  [[nodiscard]] QXLogHandle& defaultLog() override { return handle_; }

 private:
  class Handle final : public QXLogHandle {
   public:
    explicit Handle(const LinuxLogOptions& options);
    [[nodiscard]] bool isEnabled(QXLogType type) const override;
    void write(QXLogType type, const std::string& message) override;

   private:
    // Whether a line that this thread writes is within what is allowed; tells what was left out before.
    [[nodiscard]] bool isAllowed(QXLogType type);
    void put(const QXLogMessage& message);

    const bool isInfoEnabled_;
    const bool isDebugEnabled_;
    const std::function<LogAllowance::Time()> now_;
    const StreamLogSink stream_;
    std::optional<JournalLogSink> journal_;

    std::mutex mutex_;  // guards the allowance; nothing is written with it
    LogAllowance allowance_;
  };

  Handle handle_;
};

}  // namespace docuvend::linux_platform
