// Where log entries go. Nothing here fails its caller: what cannot be written is lost. All operations may be called from any thread.
#pragma once

#include <atomic>
#include <chrono>
#include <string>
#include <string_view>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

enum class LogWritten { no, yes };

// One line per entry, "identifier[pid]: text".
class StreamLogSink {
 public:
  // `descriptor` outlives the sink; it is not closed.
  StreamLogSink(int descriptor, std::string identifier);

  // A closed pipe loses the line; its signal does not reach the program.
  void write(std::string_view text) const;

 private:
  const int descriptor_;
  const std::string identifier_;
};

// One datagram per entry in the journal's native form, with priority and identifier as fields.
class JournalLogSink {
 public:
  JournalLogSink(std::string socketPath, std::string identifier);

  // The text must be one line. Waits a bounded time for a journal that is behind, and after that a while not at all.
  [[nodiscard]] LogWritten write(QXLogType type, std::string_view text) const;

 private:
  const std::string socketPath_;
  const std::string identifier_;
  UniqueDescriptor socket_;
  mutable std::atomic<std::chrono::steady_clock::time_point> waitsAgain_{};
};

}  // namespace docuvend::linux_platform
