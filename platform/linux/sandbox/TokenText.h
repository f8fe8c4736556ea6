// The pieces of text that tokens and floors are made of. Reading is strict: of one meaning there is one text, and nothing else is accepted.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace docuvend::linux_platform {

inline constexpr std::size_t kMaximumTokenPathLength = 4095;

// Says which of two tokens was issued before a cut, and which after it. At least 1.
using TokenNumber = std::uint64_t;
inline constexpr std::size_t kMaximumTokenNumberDigits = 18;

// Letters, digits and "/-._~" stand for themselves, every other byte is "%" and two digits.
[[nodiscard]] std::string escapedPath(std::string_view path);
// None unless it is the text of an absolute path within its maximum length.
[[nodiscard]] std::optional<std::string> pathFrom(std::string_view text);

// Decimal without leading zeros.
[[nodiscard]] std::optional<TokenNumber> tokenNumberFrom(std::string_view text);

inline constexpr std::string_view kLowerHex = "0123456789abcdef";

template <std::size_t N>
void appendHex(std::string& text, const std::array<std::uint8_t, N>& bytes) {
  for (const std::uint8_t byte : bytes) {
    text += kLowerHex[byte >> 4U];
    text += kLowerHex[byte & 15U];
  }
}

template <std::size_t N>
[[nodiscard]] bool readHex(std::string_view text, std::array<std::uint8_t, N>& bytes) {
  if (text.size() != 2 * N) return false;
  for (std::size_t i = 0; i < N; ++i) {
    const auto high = kLowerHex.find(text[2 * i]);
    const auto low = kLowerHex.find(text[2 * i + 1]);
    if (high == std::string_view::npos || low == std::string_view::npos) return false;
    bytes[i] = static_cast<std::uint8_t>(high * 16 + low);
  }
  return true;
}

}  // namespace docuvend::linux_platform
