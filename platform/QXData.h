// Bytes without a meaning of their own: sandbox tokens, data values on the wire.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace docuvend {

struct QXData {
  std::vector<std::uint8_t> bytes;

  [[nodiscard]] static QXData fromText(std::string_view text) { return QXData{{text.begin(), text.end()}}; }
  [[nodiscard]] std::string text() const { return {bytes.begin(), bytes.end()}; }

  friend bool operator==(const QXData&, const QXData&) = default;
};

}  // namespace docuvend
