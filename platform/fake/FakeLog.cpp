#include "platform/fake/FakeLog.h"

#include "platform/fake/AssertedMessages.h"

namespace docuvend::fake_platform {
namespace {

std::size_t indexOf(QXLogType type) { return static_cast<std::size_t>(type); }

}  // namespace

bool operator==(const FakeLogEntry& one, const FakeLogEntry& other) {
  if (one.type != other.type || one.text != other.text) return false;
  if (one.isWritten != other.isWritten) noteAsserted({one.type, one.text});
  return true;
}

std::ostream& operator<<(std::ostream& stream, const FakeLogEntry& entry) {
  static constexpr std::array kTypes{"default", "info", "debug", "fault"};
  return stream << kTypes[indexOf(entry.type)] << ": " << entry.text;
}

FakeLog::FakeLog() : handle_(*this) {}

void FakeLog::setEnabled(QXLogType type, FakeLogSwitch to) {
  const std::lock_guard lock(mutex_);
  enabled_[indexOf(type)] = to == FakeLogSwitch::on;
}

std::vector<FakeLogEntry> FakeLog::entries() const {
  const std::lock_guard lock(mutex_);
  return entries_;
}

std::vector<std::string> FakeLog::texts() const {
  std::vector<std::string> texts;
  for (const FakeLogEntry& entry : entries()) texts.push_back(entry.text);
  return texts;
}

std::vector<std::string> FakeLog::texts(QXLogType type) const {
  std::vector<std::string> texts;
  for (const FakeLogEntry& entry : entries()) {
    if (entry.type == type) texts.push_back(entry.text);
  }
  return texts;
}

std::size_t FakeLog::writes() const {
  const std::lock_guard lock(mutex_);
  return writes_;
}

void FakeLog::clear() {
  const std::lock_guard lock(mutex_);
  entries_.clear();
  writes_ = 0;
}

bool FakeLog::Handle::isEnabled(QXLogType type) const {
  const std::lock_guard lock(log_.mutex_);
  return log_.enabled_[indexOf(type)];
}

void FakeLog::Handle::write(QXLogType type, const std::string& message) {
  const std::lock_guard lock(log_.mutex_);
  ++log_.writes_;
  if (log_.enabled_[indexOf(type)]) log_.entries_.push_back({type, message, /*isWritten=*/true});
}

}  // namespace docuvend::fake_platform
