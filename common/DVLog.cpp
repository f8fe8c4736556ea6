#include "common/DVLog.h"

#include "platform/QXPlatform.h"

namespace docuvend {

QXLogHandle& dv_default_log() { return QXPlatform::current().log.defaultLog(); }

std::string dvDescribe(std::string_view value) { return std::string(value); }
std::string dvDescribe(int value) { return std::to_string(value); }
std::string dvDescribe(const QXURL& value) { return value.absoluteString(); }
std::string dvDescribe(const QXUUID& value) { return value.string(); }
std::string dvDescribe(const QXError& value) { return value.description(); }
std::string dvDescribe(const QXDictionary& value) { return QXValue(value).description(); }
std::string dvDescribe(const ProviderID& value) { return value.value; }
std::string dvDescribe(const ItemID& value) { return value.value; }
std::string dvDescribe(const ConsumerID& value) { return value.value; }

std::string dvDescribe(std::span<const std::string_view> list) {
  QXArray array;
  for (const std::string_view element : list) array.emplace_back(std::string(element));
  return QXValue(std::move(array)).description();
}

std::string dvShortened(std::string text) {
  if (text.size() <= kDVLongestLoggedValue) return text;
  std::size_t length = kDVLongestLoggedValue;
  const auto continuesCharacter = [&text](std::size_t at) { return (static_cast<unsigned char>(text[at]) & 0xC0U) == 0x80U; };
  while (length > 0 && continuesCharacter(length)) --length;
  text.resize(length);
  return text.append("…");
}

std::string dvFormat(std::string_view format, std::span<const std::string> values) {
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

}  // namespace docuvend
