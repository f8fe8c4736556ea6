#include "platform/linux/sandbox/TokenText.h"

#include <charconv>

namespace docuvend::linux_platform {
namespace {

constexpr std::string_view kUpperHex = "0123456789ABCDEF";

bool isPlain(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
         std::string_view("/-._~").find(c) != std::string_view::npos;
}

// None for an escape that was not needed, too: one path has one text.
std::optional<std::string> unescaped(std::string_view text) {
  std::string path;
  while (!text.empty()) {
    if (text[0] != '%') {
      if (!isPlain(text[0])) return std::nullopt;
      path += text[0];
      text.remove_prefix(1);
      continue;
    }
    if (text.size() < 3) return std::nullopt;
    const auto high = kUpperHex.find(text[1]);
    const auto low = kUpperHex.find(text[2]);
    if (high == std::string_view::npos || low == std::string_view::npos) return std::nullopt;
    const char byte = static_cast<char>(high * 16 + low);
    if (byte == '\0' || isPlain(byte)) return std::nullopt;
    path += byte;
    text.remove_prefix(3);
  }
  return path;
}

}  // namespace

std::string escapedPath(std::string_view path) {
  std::string text;
  for (const char c : path) {
    if (isPlain(c)) {
      text += c;
      continue;
    }
    const auto byte = static_cast<std::uint8_t>(c);
    text += '%';
    text += kUpperHex[byte >> 4U];
    text += kUpperHex[byte & 15U];
  }
  return text;
}

std::optional<std::string> pathFrom(std::string_view text) {
  auto path = unescaped(text);
  if (!path || !path->starts_with('/') || path->size() > kMaximumTokenPathLength) return std::nullopt;
  return path;
}

std::optional<TokenNumber> tokenNumberFrom(std::string_view text) {
  if (text.empty() || text.size() > kMaximumTokenNumberDigits || text[0] < '1' || text[0] > '9') return std::nullopt;
  TokenNumber number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

}  // namespace docuvend::linux_platform
