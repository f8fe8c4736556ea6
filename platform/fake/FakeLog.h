// A log that remembers.
//
// Where it differs from a real adapter: nothing is written anywhere and no text is escaped or cut; every type, info and debug too, is on
// until the test switches it off; `writes` counts every call, so that a test sees whether a message was formatted at all. A message of a
// type that is off is counted and not kept.
#pragma once

#include <array>
#include <cstddef>
#include <functional>
#include <mutex>
#include <ostream>
#include <string>
#include <vector>

#include "platform/log.h"

namespace docuvend::fake_platform {

// A message in the log, or a test's expectation of one. When one of each is found equal, the message has been asserted, and that is noted
// (AssertedMessages.h).
struct FakeLogEntry {
  QXLogType type;
  std::string text;
  bool isWritten = false;  // the log sets it in what it gives out

  friend bool operator==(const FakeLogEntry& one, const FakeLogEntry& other);
  friend std::ostream& operator<<(std::ostream& stream, const FakeLogEntry& entry);
};

enum class FakeLogSwitch { off, on };

// All operations may be called from any thread.
class FakeLog final : public QXLogService {
 public:
  FakeLog();

  [[nodiscard]] QXLogHandle& defaultLog() override { return handle_; }

  void setEnabled(QXLogType type, FakeLogSwitch to);
  // Called with each message that is kept, by its writer, when it is among the entries; instead of the callback that was set before. It may
  // not write itself.
  void onWrite(std::function<void(const FakeLogEntry&)> callback);

  // In the order of writing.
  [[nodiscard]] std::vector<FakeLogEntry> entries() const;
  [[nodiscard]] std::vector<std::string> texts() const;
  [[nodiscard]] std::vector<std::string> texts(QXLogType type) const;
  [[nodiscard]] std::size_t writes() const;
  // Forgets the entries and the count; the switches stay.
  void clear();

 private:
  class Handle final : public QXLogHandle {
   public:
    explicit Handle(FakeLog& log) : log_(log) {}
    [[nodiscard]] bool isEnabled(QXLogType type) const override;
    void write(QXLogType type, const std::string& message) override;

   private:
    FakeLog& log_;
  };

  Handle handle_;
  mutable std::mutex mutex_;  // guards what follows
  std::array<bool, 4> enabled_{true, true, true, true};
  std::vector<FakeLogEntry> entries_;
  std::size_t writes_ = 0;
  std::function<void(const FakeLogEntry&)> onWrite_;
};

}  // namespace docuvend::fake_platform
