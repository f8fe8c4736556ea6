#include "platform/fake/FakeLog.h"

#include <utility>

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

void FakeLog::onWrite(std::function<void(const FakeLogEntry&)> callback) {
  const std::lock_guard lock(mutex_);
  onWrite_ = std::move(callback);
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
  const FakeLogEntry entry{type, message, /*isWritten=*/true};
  std::function<void(const FakeLogEntry&)> callback;
  {
    const std::lock_guard lock(log_.mutex_);
    ++log_.writes_;
    if (!log_.enabled_[indexOf(type)]) return;
    log_.entries_.push_back(entry);
    callback = log_.onWrite_;
  }
  if (callback) callback(entry);
}

}  // namespace docuvend::fake_platform
