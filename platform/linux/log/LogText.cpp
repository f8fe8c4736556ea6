#include "platform/linux/log/LogText.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdio>

#include "platform/QXURL.h"

namespace docuvend::linux_platform {
namespace {

// The length of the well-formed UTF-8 character in front, 0 when there is none.
std::size_t characterLength(std::string_view text) {
  const auto lead = static_cast<unsigned char>(text.front());
  const std::size_t length = lead < 0x80 ? 1 : lead < 0xC0 ? 0 : lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
  return length <= text.size() && qxIsValidUTF8(text.substr(0, length)) ? length : 0;
}

std::uint32_t codePoint(std::string_view character) {
  const auto lead = static_cast<unsigned char>(character.front());
  if (character.size() == 1) return lead;
  std::uint32_t code = lead & (0xFFU >> (character.size() + 1));
  for (const char c : character.substr(1)) code = code << 6U | (static_cast<unsigned char>(c) & 0x3FU);
  return code;
}

std::string escapedByte(unsigned char byte) {
  std::array<char, 8> text{};
  std::snprintf(text.data(), text.size(), "\\x%02x", byte);
  return text.data();
}

std::string escapedCode(std::uint32_t code) {
  std::array<char, 16> text{};
  std::snprintf(text.data(), text.size(), "\\u{%x}", static_cast<unsigned>(code));
  return text.data();
}

bool isHarmful(std::uint32_t code) {
  struct Range {
    std::uint32_t first;
    std::uint32_t last;
  };
  static constexpr std::array<Range, 5> kRanges = {{
      {0x0080, 0x009F},  // C1 controls
      {0x061C, 0x061C},  // bidirectional marks, embeddings, overrides and isolates
      {0x200E, 0x200F},
      {0x2028, 0x202E},  // line and paragraph separators among them
      {0x2066, 0x2069},
  }};
  return std::any_of(kRanges.begin(), kRanges.end(), [code](const Range& range) { return range.first <= code && code <= range.last; });
}

std::string visible(std::string_view character) {
  const std::uint32_t code = codePoint(character);
  switch (code) {
    case '\n':
      return "\\n";
    case '\r':
      return "\\r";
    case '\t':
      return "\\t";
    default:
      break;
  }
  if (code < 0x20 || code == 0x7F) return escapedByte(static_cast<unsigned char>(code));
  return isHarmful(code) ? escapedCode(code) : std::string(character);
}

// Takes the character in front, or the byte that is none, off the text: how it is shown.
std::string nextVisible(std::string_view& rest) {
  const std::size_t length = characterLength(rest);
  std::string shown = length == 0 ? escapedByte(static_cast<unsigned char>(rest.front())) : visible(rest.substr(0, length));
  rest.remove_prefix(std::max<std::size_t>(length, 1));
  return shown;
}

}  // namespace

std::string visibleText(std::string_view text) {
  std::string result;
  while (!text.empty()) result += nextVisible(text);
  return result;
}

std::string visibleLogText(std::string_view text) {
  std::string result;
  while (!text.empty()) {
    const std::size_t missing = text.size();
    const std::string next = nextVisible(text);
    if (result.size() + next.size() > kLongestLogText) return result + "... [" + std::to_string(missing) + " more bytes]";
    result += next;
  }
  return result;
}

}  // namespace docuvend::linux_platform
