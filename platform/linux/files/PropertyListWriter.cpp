#include "platform/linux/files/PropertyListWriter.h"

#include <algorithm>
#include <cstdint>
#include <string_view>

#include "platform/linux/files/property_list_scalars.h"
#include "platform/xml_text.h"

namespace docuvend::linux_platform {
namespace {

// One of the characters that cannot stand for themselves.
std::string_view escaped(char c) {
  if (c == '&') return "&amp;";
  if (c == '<') return "&lt;";
  if (c == '>') return "&gt;";
  return "&#13;";  // as itself it would read back as a line feed
}

// Every operation is false when the list cannot be written; the text is of no use then.
class Writer {
 public:
  [[nodiscard]] std::optional<std::string> list(const QXDictionary& dictionary) {
    text_ = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
    elements_ = 1;  // <plist>
    if (!begin() || !write(dictionary)) return std::nullopt;
    text_ += "</plist>\n";
    if (text_.size() > kPropertyListMaximumBytes) return std::nullopt;
    return std::move(text_);
  }

 private:
  [[nodiscard]] bool write(const QXValue& value) {
    if (!begin()) return false;
    switch (value.kind()) {
      case QXValueKind::boolean:
        return line(*value.as<bool>() ? "<true/>" : "<false/>");
      case QXValueKind::integer:
        return line("<integer>" + std::to_string(*value.as<std::int64_t>()) + "</integer>");
      case QXValueKind::real: {
        const auto number = textFromReal(*value.as<double>());
        return number && line("<real>" + *number + "</real>");
      }
      case QXValueKind::string:
        return leaf("string", *value.as<std::string>());
      case QXValueKind::data:
        return line("<data>" + textFromData(*value.as<QXData>()) + "</data>");
      case QXValueKind::array:
        return write(*value.as<QXArray>());
      case QXValueKind::dictionary:
        return write(*value.as<QXDictionary>());
      case QXValueKind::absent:
      case QXValueKind::url:
      case QXValueKind::uuid:
      case QXValueKind::error:
      case QXValueKind::descriptor:
        break;
    }
    return false;
  }

  [[nodiscard]] bool write(const QXArray& array) {
    if (array.empty()) return line("<array/>");
    if (!open("<array>")) return false;
    for (const QXValue& element : array) {
      if (!write(element)) return false;
    }
    return close("</array>");
  }

  [[nodiscard]] bool write(const QXDictionary& dictionary) {
    if (dictionary.empty()) return line("<dict/>");
    if (!open("<dict>")) return false;
    for (const auto& [key, value] : dictionary) {
      if (!begin() || !leaf("key", key) || !write(value)) return false;
    }
    return close("</dict>");
  }

  [[nodiscard]] bool leaf(std::string_view name, std::string_view content) {
    if (!qxIsXMLText(content)) return false;
    std::string element(1, '<');
    element.append(name).append(1, '>');
    while (!content.empty()) {
      const std::size_t plain = std::min(content.find_first_of("&<>\r"), content.size());
      element += content.substr(0, plain);
      content.remove_prefix(plain);
      if (content.empty()) break;
      element += escaped(content.front());
      content.remove_prefix(1);
    }
    return line(element + "</" + std::string(name) + ">");
  }

  // One more element, at the present depth.
  [[nodiscard]] bool begin() { return ++elements_ <= kPropertyListMaximumElements && depth_ + 2 <= kPropertyListMaximumDepth; }

  [[nodiscard]] bool open(std::string_view tag) {
    const bool fits = line(tag);
    ++depth_;
    return fits;
  }
  [[nodiscard]] bool close(std::string_view tag) {
    --depth_;
    return line(tag);
  }
  [[nodiscard]] bool line(std::string_view content) {
    text_.append(depth_, '\t').append(content).append("\n");
    return text_.size() <= kPropertyListMaximumBytes;
  }

  std::string text_;
  std::size_t elements_ = 0;
  std::size_t depth_ = 0;  // containers around the present element, without <plist>
};

}  // namespace

std::optional<std::string> propertyListXML(const QXDictionary& dictionary) { return Writer().list(dictionary); }

}  // namespace docuvend::linux_platform
