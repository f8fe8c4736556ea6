#include "platform/QXURL.h"

#include <cstdint>

namespace docuvend {
namespace {

constexpr std::string_view kPrefix = "file://";
constexpr std::string_view kHexDigits = "0123456789ABCDEF";

bool isPlain(unsigned char c) {  // may stand in a URL path as itself
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
         std::string_view("-._~!$&'()*+,;=:@/").find(static_cast<char>(c)) != std::string_view::npos;
}

int hexValue(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

std::optional<std::string> decoded(std::string_view path) {
  std::string text;
  text.reserve(path.size());
  for (std::size_t i = 0; i < path.size(); ++i) {
    if (path[i] != '%') {
      if (!isPlain(static_cast<unsigned char>(path[i]))) return std::nullopt;
      text += path[i];
      continue;
    }
    if (i + 2 >= path.size()) return std::nullopt;
    const int high = hexValue(path[i + 1]);
    const int low = hexValue(path[i + 2]);
    if (high < 0 || low < 0 || (high == 0 && low == 0)) return std::nullopt;
    text += static_cast<char>(high * 16 + low);
    i += 2;
  }
  return text;
}

std::string encoded(std::string_view path, bool isComponent) {
  std::string text;
  for (const char c : path) {
    const auto byte = static_cast<unsigned char>(c);
    if (isPlain(byte) && !(isComponent && c == '/')) {
      text += c;
    } else {
      text += '%';
      text += kHexDigits[byte >> 4U];
      text += kHexDigits[byte & 15U];
    }
  }
  return text;
}

}  // namespace

bool qxIsValidUTF8(std::string_view text) {
  for (std::size_t i = 0; i < text.size();) {
    const auto lead = static_cast<std::uint8_t>(text[i]);
    const std::size_t length = lead < 0x80 ? 1 : (lead >> 5U) == 6 ? 2 : (lead >> 4U) == 14 ? 3 : (lead >> 3U) == 30 ? 4 : 0;
    if (length == 0 || i + length > text.size()) return false;
    std::uint32_t point = length == 1 ? lead : lead & (0x7FU >> length);
    for (std::size_t k = 1; k < length; ++k) {
      const auto next = static_cast<std::uint8_t>(text[i + k]);
      if ((next >> 6U) != 2) return false;
      point = (point << 6U) | (next & 0x3FU);
    }
    static constexpr std::uint32_t kSmallest[] = {0, 0, 0x80, 0x800, 0x10000};
    if (point < kSmallest[length] || point > 0x10FFFF || (point >= 0xD800 && point <= 0xDFFF)) return false;
    i += length;
  }
  return true;
}

std::optional<QXURL> QXURL::fromString(std::string_view text) {
  if (text.substr(0, 5) != "file:") return std::nullopt;
  std::string_view path = text.substr(5);
  if (path.substr(0, 2) == "//") {
    path.remove_prefix(2);
    if (path.substr(0, 9) == "localhost") path.remove_prefix(9);
  }
  if (path.empty() || path.front() != '/') return std::nullopt;
  const auto plain = decoded(path);
  if (!plain || !qxIsValidUTF8(*plain)) return std::nullopt;
  return QXURL(std::string(kPrefix) + std::string(path));
}

QXURL QXURL::fileURL(std::string_view path, QXURLKind kind) {
  std::string text = std::string(kPrefix) + encoded(path, /*isComponent=*/false);
  if (kind == QXURLKind::directory && text.back() != '/') text += '/';
  return QXURL(std::move(text));
}

std::string QXURL::fileSystemPath() const {
  std::string path = *decoded(std::string_view(text_).substr(kPrefix.size()));
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

QXURL QXURL::appendingPathComponent(std::string_view component, QXURLKind kind) const {
  std::string text = text_;
  if (text.back() != '/') text += '/';
  text += encoded(component, /*isComponent=*/true);
  if (kind == QXURLKind::directory) text += '/';
  return QXURL(std::move(text));
}

}  // namespace docuvend
