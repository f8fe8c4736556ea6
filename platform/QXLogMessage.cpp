#include "platform/QXLogMessage.h"

#include <utility>

namespace docuvend {

std::string qxDescribe(std::string_view value) { return std::string(value); }
std::string qxDescribe(const QXURL& value) { return value.absoluteString(); }
std::string qxDescribe(const QXUUID& value) { return value.string(); }
std::string qxDescribe(const QXError& value) { return value.description(); }
std::string qxDescribe(const QXDictionary& value) { return QXValue(value).description(); }
std::string qxDescribe(const ProviderID& value) { return value.value; }
std::string qxDescribe(const ItemID& value) { return value.value; }
std::string qxDescribe(const ConsumerID& value) { return value.value; }

std::string qxDescribe(std::span<const std::string_view> list) {
  QXArray array;
  for (const std::string_view element : list) array.emplace_back(std::string(element));
  return QXValue(std::move(array)).description();
}

std::string qxFormat(std::string_view format, std::span<const std::string> values) {
  std::string text;
  std::size_t next = 0;
  for (std::size_t i = 0; i < format.size(); ++i) {
    const bool isPlaceholder =
        format[i] == '%' && i + 1 < format.size() && std::string_view("@sd").find(format[i + 1]) != std::string_view::npos;
    if (isPlaceholder && next < values.size()) {
      text += values[next++];
      ++i;
    } else {
      text += format[i];
    }
  }
  return text;
}

void qxLog(QXLogHandle& log, const QXLogMessage& message) { log.write(message.type, message.text); }

}  // namespace docuvend
