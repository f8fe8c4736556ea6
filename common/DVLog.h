// The system's one log and the convention of its levels.
//
//   dvLog("[INFO] Resolved URL to provider %@.", provider.identifier());
//
// Every message begins with its level in brackets, and the level decides the log type: "[NOTICE]" default, "[INFO]" info, "[DEBUG]"
// debug, "[ERROR]" fault. The level and the number of placeholders (%@ %s %d) are checked when the program is compiled. A message is
// formatted only when its type is enabled. An absent value prints as "(null)", and of a long one only the beginning is shown.
#pragma once

#include <array>
#include <concepts>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <vector>

#include "platform/QXValue.h"
#include "platform/identifiers.h"
#include "platform/log.h"

namespace docuvend {

[[nodiscard]] QXLogHandle& dv_default_log();

[[nodiscard]] std::string dvDescribe(std::string_view value);
[[nodiscard]] std::string dvDescribe(int value);
[[nodiscard]] std::string dvDescribe(const QXURL& value);
[[nodiscard]] std::string dvDescribe(const QXUUID& value);
[[nodiscard]] std::string dvDescribe(const QXError& value);
[[nodiscard]] std::string dvDescribe(const QXDictionary& value);
[[nodiscard]] std::string dvDescribe(const ProviderID& value);
[[nodiscard]] std::string dvDescribe(const ItemID& value);
[[nodiscard]] std::string dvDescribe(const ConsumerID& value);
[[nodiscard]] std::string dvDescribe(std::span<const std::string_view> list);

template <class T>
[[nodiscard]] std::string dvDescribe(const std::optional<T>& value) {
  return value ? dvDescribe(*value) : "(null)";
}

// A thing that describes itself.
template <class T>
requires requires(const T& thing) {
  { thing.description() } -> std::convertible_to<std::string>;
}
[[nodiscard]] std::string dvDescribe(const std::shared_ptr<T>& value) { return value ? value->description() : "(null)"; }

// Of one value in a message, in bytes: most values are what somebody else chose.
inline constexpr std::size_t kDVLongestLoggedValue = 1024;

// The text, or its beginning of whole characters and an ellipsis when it is longer than that.
[[nodiscard]] std::string dvShortened(std::string text);

// Puts the values in the places of the format's placeholders, in order.
[[nodiscard]] std::string dvFormat(std::string_view format, std::span<const std::string> values);

template <class... Values>
struct DVLogFormat {
  template <std::size_t N>
  consteval DVLogFormat(const char (&literal)[N]) : text(literal, N - 1), type(typeOf(text)) {
    std::size_t placeholders = 0;
    for (std::size_t i = 0; i + 1 < text.size(); ++i) {
      if (text[i] == '%' && (text[i + 1] == '@' || text[i + 1] == 's' || text[i + 1] == 'd')) ++placeholders;
    }
    if (placeholders != sizeof...(Values)) throw "a log message needs one value for each placeholder";
  }

  std::string_view text;
  QXLogType type;

 private:
  static consteval QXLogType typeOf(std::string_view text) {
    if (text.starts_with("[NOTICE] ")) return QXLogType::defaultType;
    if (text.starts_with("[INFO] ")) return QXLogType::info;
    if (text.starts_with("[DEBUG] ")) return QXLogType::debug;
    if (text.starts_with("[ERROR] ")) return QXLogType::fault;
    throw "a log message begins with its level";
  }
};

template <class... Values>
void dvLog(std::type_identity_t<DVLogFormat<Values...>> format, const Values&... values) {
  QXLogHandle& log = dv_default_log();
  if (!log.isEnabled(format.type)) return;
  const std::array<std::string, sizeof...(Values)> texts = {dvShortened(dvDescribe(values))...};
  log.write(format.type, dvFormat(format.text, texts));
}

}  // namespace docuvend
