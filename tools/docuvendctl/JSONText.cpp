#include "tools/docuvendctl/JSONText.h"

#include <array>
#include <cstdio>

#include "platform/QXURL.h"

namespace docuvend::ctl {
namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";
constexpr std::size_t kLongestCharacter = 4;

// The length of the well-formed character in front, 0 when there is none.
std::size_t characterLength(std::string_view text) {
  for (std::size_t length = 1; length <= kLongestCharacter && length <= text.size(); ++length) {
    if (qxIsValidUTF8(text.substr(0, length))) return length;
  }
  return 0;
}

std::string escaped(char c) {
  switch (c) {
    case '"':
      return "\\\"";
    case '\\':
      return "\\\\";
    case '\n':
      return "\\n";
    case '\r':
      return "\\r";
    case '\t':
      return "\\t";
    default:
      break;
  }
  if (static_cast<unsigned char>(c) >= ' ' && c != '\x7f') return {c};
  std::array<char, 8> text{};
  std::snprintf(text.data(), text.size(), "\\u%04x", static_cast<unsigned>(c));
  return text.data();
}

}  // namespace

std::string jsonString(std::string_view text) {
  std::string result = "\"";
  while (!text.empty()) {
    const std::size_t length = characterLength(text);
    if (length == 0) {
      result += kReplacement;
    } else if (length == 1) {
      result += escaped(text.front());
    } else {
      result += text.substr(0, length);
    }
    text.remove_prefix(length == 0 ? 1 : length);
  }
  return result + "\"";
}

void JSONObject::addRaw(std::string_view name, const std::string& value) {
  members_ += (members_.empty() ? "" : ",") + jsonString(name) + ":" + value;
}

}  // namespace docuvend::ctl
