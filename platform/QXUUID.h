// 128 bits that identify one thing. The platform chooses them; this type only carries, prints and compares them.
#pragma once

#include <array>
#include <compare>
#include <cstdint>
#include <string>

namespace docuvend {

struct QXUUID {
  std::array<std::uint8_t, 16> bytes{};

  // The usual form: 8-4-4-4-12 upper-case hexadecimal digits.
  [[nodiscard]] std::string string() const;

  friend auto operator<=>(const QXUUID&, const QXUUID&) = default;
};

}  // namespace docuvend
