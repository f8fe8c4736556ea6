// The widths are those of the C library's table, which a locale opens: a character may take two columns (East Asian, emoji) or none
// (combining marks). Where the machine lacks that locale every character counts as one column.
#include "tools/docuvendctl/TextWidth.h"

#include <locale.h>
#include <wchar.h>

#include <cstdint>

namespace docuvend::ctl {
namespace {

constexpr std::string_view kEllipsis = "\xe2\x80\xa6";
constexpr std::size_t kEllipsisWidth = 1;

struct Character {
  std::size_t length;  // in bytes
  std::size_t width;
};

std::size_t widthOf(wchar_t code) {
  static const locale_t locale = ::newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
  if (locale == nullptr) return 1;
  const locale_t before = ::uselocale(locale);
  const int width = ::wcwidth(code);
  ::uselocale(before);
  return width < 0 ? 1 : static_cast<std::size_t>(width);
}

Character firstCharacter(std::string_view text) {
  const auto lead = static_cast<unsigned char>(text.front());
  if (lead < 0x80) return {1, 1};
  const std::size_t length = lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
  std::uint32_t code = lead & (0xFFU >> (length + 1));
  for (const char c : text.substr(1, length - 1)) code = code << 6U | (static_cast<unsigned char>(c) & 0x3FU);
  return {length, widthOf(static_cast<wchar_t>(code))};
}

}  // namespace

std::size_t textWidth(std::string_view text) {
  std::size_t width = 0;
  while (!text.empty()) {
    const Character first = firstCharacter(text);
    width += first.width;
    text.remove_prefix(first.length);
  }
  return width;
}

std::string cutToWidth(std::string_view text, std::size_t width) {
  if (textWidth(text) <= width) return std::string(text);
  if (width < kEllipsisWidth) return {};
  const std::size_t room = width - kEllipsisWidth;
  std::size_t end = 0;
  for (std::size_t used = 0; end < text.size();) {
    const Character next = firstCharacter(text.substr(end));
    if (used + next.width > room) break;
    used += next.width;
    end += next.length;
  }
  return std::string(text.substr(0, end)).append(kEllipsis);
}

std::string filledToWidth(std::string text, std::size_t width) {
  const std::size_t used = textWidth(text);
  if (used < width) text.append(width - used, ' ');
  return text;
}

}  // namespace docuvend::ctl
