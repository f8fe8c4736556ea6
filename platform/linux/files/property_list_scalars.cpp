#include "platform/linux/files/property_list_scalars.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>

namespace docuvend::linux_platform {
namespace {

constexpr std::string_view kDigits = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr char kPadding = '=';

std::string_view trimmed(std::string_view text) {
  while (!text.empty() && isXMLSpace(text.front())) text.remove_prefix(1);
  while (!text.empty() && isXMLSpace(text.back())) text.remove_suffix(1);
  return text;
}

template <class Number>
std::optional<Number> numberFromText(std::string_view text) {
  text = trimmed(text);
  Number number{};
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

}  // namespace

std::optional<std::int64_t> integerFromText(std::string_view text) { return numberFromText<std::int64_t>(text); }

std::optional<double> realFromText(std::string_view text) {
  const auto number = numberFromText<double>(text);
  return number && std::isfinite(*number) ? number : std::nullopt;
}

std::optional<std::string> textFromReal(double value) {
  if (!std::isfinite(value)) return std::nullopt;
  std::array<char, 32> text{};
  const auto end = std::to_chars(text.data(), text.data() + text.size(), value).ptr;
  return std::string(text.data(), end);
}

std::optional<QXData> dataFromText(std::string_view text) {
  QXData data;
  std::uint32_t bits = 0;  // of the current group of four digits
  int digits = 0;
  int padding = 0;
  for (const char c : text) {
    if (isXMLSpace(c)) continue;
    const std::size_t value = c == kPadding ? 0 : kDigits.find(c);
    if (value == std::string_view::npos || (padding > 0 && digits == 0)) return std::nullopt;
    if (c == kPadding) {
      if (++padding > 2) return std::nullopt;
    } else if (padding > 0) {
      return std::nullopt;
    }
    bits = (bits << 6U) | static_cast<std::uint32_t>(value);
    if (++digits < 4) continue;
    for (int k = 0; k < 3 - padding; ++k) data.bytes.push_back(static_cast<std::uint8_t>(bits >> (16U - 8U * static_cast<unsigned>(k))));
    bits = 0;
    digits = 0;
  }
  if (digits != 0) return std::nullopt;
  return data;
}

std::string textFromData(const QXData& data) {
  std::string text;
  text.reserve((data.bytes.size() + 2) / 3 * 4);
  for (std::size_t i = 0; i < data.bytes.size(); i += 3) {
    const std::size_t count = std::min<std::size_t>(3, data.bytes.size() - i);
    std::uint32_t bits = 0;
    for (std::size_t k = 0; k < 3; ++k) bits = (bits << 8U) | (k < count ? data.bytes[i + k] : 0U);
    for (std::size_t k = 0; k < 4; ++k) text += k <= count ? kDigits[(bits >> (18U - 6U * k)) & 63U] : kPadding;
  }
  return text;
}

}  // namespace docuvend::linux_platform
