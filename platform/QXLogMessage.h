// A message for the system's log, made of a format and its values.
//
//   qxLog(log, "[NOTICE] PID %d declares itself to be %@.", process, bundleIdentifier);
//
// Every message begins with its level in brackets, and the level decides the log type: "[NOTICE]" default, "[INFO]" info, "[DEBUG]"
// debug, "[ERROR]" fault. The level and the number of placeholders (%@ %s %d) are checked when the program is compiled. The daemon writes
// nothing to its log that is not made here: a list of all that it can say is read from its formats.
#pragma once

#include <array>
#include <concepts>
#include <cstddef>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/QXValue.h"
#include "platform/identifiers.h"
#include "platform/log.h"

namespace docuvend {

// The type at which a message of its level is written; none for a text without a level.
[[nodiscard]] constexpr std::optional<QXLogType> qxTypeOfLevel(std::string_view message) {
  if (message.starts_with("[NOTICE] ")) return QXLogType::defaultType;
  if (message.starts_with("[INFO] ")) return QXLogType::info;
  if (message.starts_with("[DEBUG] ")) return QXLogType::debug;
  if (message.starts_with("[ERROR] ")) return QXLogType::fault;
  return std::nullopt;
}

// A literal with that many placeholders; anything else is no format, and does not compile.
template <std::size_t Places>
struct QXLogFormat {
  template <std::size_t N>
  consteval QXLogFormat(const char (&literal)[N]) : text(literal, N - 1), type(typeOf(text)) {
    std::size_t placeholders = 0;
    for (std::size_t i = 0; i + 1 < text.size(); ++i) {
      if (text[i] == '%' && (text[i + 1] == '@' || text[i + 1] == 's' || text[i + 1] == 'd')) ++placeholders;
    }
    if (placeholders != Places) throw "a log message needs one value for each placeholder";
  }

  std::string_view text;
  QXLogType type;

 private:
  static consteval QXLogType typeOf(std::string_view text) {
    if (const auto type = qxTypeOfLevel(text)) return *type;
    throw "a log message begins with its level";
  }
};

// How a value stands in a message; an absent one as "(null)".
[[nodiscard]] std::string qxDescribe(std::string_view value);
[[nodiscard]] std::string qxDescribe(const QXURL& value);
[[nodiscard]] std::string qxDescribe(const QXUUID& value);
[[nodiscard]] std::string qxDescribe(const QXError& value);
[[nodiscard]] std::string qxDescribe(const QXDictionary& value);
[[nodiscard]] std::string qxDescribe(const ProviderID& value);
[[nodiscard]] std::string qxDescribe(const ItemID& value);
[[nodiscard]] std::string qxDescribe(const ConsumerID& value);
[[nodiscard]] std::string qxDescribe(std::span<const std::string_view> list);
[[nodiscard]] std::string qxDescribe(std::integral auto value) { return std::to_string(value); }

template <class T>
[[nodiscard]] std::string qxDescribe(const std::optional<T>& value) {
  return value ? qxDescribe(*value) : "(null)";
}

// A thing that describes itself.
template <class T>
requires requires(const T& thing) {
  { thing.description() } -> std::convertible_to<std::string>;
}
[[nodiscard]] std::string qxDescribe(const std::shared_ptr<T>& value) { return value ? value->description() : "(null)"; }

// Puts the values in the places of the format's placeholders, in order.
[[nodiscard]] std::string qxFormat(std::string_view format, std::span<const std::string> values);

struct QXLogMessage {
  QXLogType type;
  std::string text;
};

// For who has to know the text before it is written, or whether it is.
template <class... Values>
[[nodiscard]] QXLogMessage qxLogMessage(QXLogFormat<sizeof...(Values)> format, const Values&... values) {
  const std::array<std::string, sizeof...(Values)> texts = {qxDescribe(values)...};
  return {format.type, qxFormat(format.text, texts)};
}

void qxLog(QXLogHandle& log, const QXLogMessage& message);

// The message is made only when its type is enabled.
template <class... Values>
void qxLog(QXLogHandle& log, QXLogFormat<sizeof...(Values)> format, const Values&... values) {
  if (log.isEnabled(format.type)) qxLog(log, qxLogMessage(format, values...));
}

}  // namespace docuvend
