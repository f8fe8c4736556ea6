#include "platform/linux/log/LinuxLog.h"

#include <sys/stat.h>

#include <charconv>
#include <cstdint>
#include <cstdlib>
#include <string_view>
#include <utility>

#include "platform/linux/base/LogSubject.h"
#include "platform/linux/log/LogText.h"

namespace docuvend::linux_platform {
namespace {

std::optional<std::string> environmentValue(const char* name) {
  const char* const value = std::getenv(name);
  return value == nullptr ? std::nullopt : std::optional<std::string>(value);
}

std::optional<std::uint64_t> number(std::string_view text) {
  std::uint64_t value = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (error != std::errc{} || end != text.data() + text.size()) return std::nullopt;
  return value;
}

// The variable is inherited by programs whose standard error leads elsewhere, so it must name this very stream.
bool leadsToTheJournal(int descriptor, const std::optional<std::string>& journalStream) {
  if (!journalStream) return false;
  const std::string_view text = *journalStream;
  const std::size_t colon = text.find(':');
  struct stat status {};
  if (colon == std::string_view::npos || ::fstat(descriptor, &status) != 0) return false;
  return number(text.substr(0, colon)) == status.st_dev && number(text.substr(colon + 1)) == status.st_ino;
}

}  // namespace

LinuxLogOptions LinuxLogOptions::fromEnvironment(std::string identifier) {
  LinuxLogOptions options;
  options.identifier = std::move(identifier);
  options.setting = environmentValue("DOCUVEND_LOG");
  options.journalStream = environmentValue("JOURNAL_STREAM");
  return options;
}

LinuxLog::LinuxLog(const LinuxLogOptions& options) : handle_(options) {}

LinuxLog::Handle::Handle(const LinuxLogOptions& options)
    : isInfoEnabled_(options.setting == "info" || options.setting == "debug"),
      isDebugEnabled_(options.setting == "debug"),
      now_(options.now),
      stream_(options.streamDescriptor, options.identifier) {
  if (leadsToTheJournal(options.streamDescriptor, options.journalStream)) {
    journal_.emplace(options.journalSocketPath, options.identifier);
  }
}

bool LinuxLog::Handle::isEnabled(QXLogType type) const {
  switch (type) {
    case QXLogType::info:
      return isInfoEnabled_;
    case QXLogType::debug:
      return isDebugEnabled_;
    case QXLogType::defaultType:
    case QXLogType::fault:
      return true;
  }
  return true;
}

void LinuxLog::Handle::write(QXLogType type, const std::string& message) {
  if (isEnabled(type) && isAllowed(type)) put({type, message});
}

bool LinuxLog::Handle::isAllowed(QXLogType type) {
  const auto now = now_();
  const auto subject = type == QXLogType::defaultType || type == QXLogType::fault ? LogSubject::current() : nullptr;
  std::vector<LogAllowance::LeftOut> counts;
  bool allowed = true;
  {
    const std::lock_guard lock(mutex_);
    counts = allowance_.dueCounts(now);
    allowed = !subject || allowance_.line(*subject, now);
  }
  for (const auto& [name, lines] : counts) put(qxLogMessage("[NOTICE] %d lines about %@ were left out.", lines, name));
  return allowed;
}

void LinuxLog::Handle::put(const QXLogMessage& message) {
  const std::string text = visibleLogText(message.text);
  if (journal_ && journal_->write(message.type, text) == LogWritten::yes) return;
  stream_.write(text);
}

}  // namespace docuvend::linux_platform
