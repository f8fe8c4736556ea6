// The limits of property lists, and the text forms of their single values. Reading and writing share both, so that whatever is written
// can be read again.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/QXData.h"

namespace docuvend::linux_platform {

inline constexpr std::size_t kPropertyListMaximumBytes = 16UL << 20U;    // of the whole text
inline constexpr std::size_t kPropertyListMaximumElements = 1UL << 18U;  // tags, <plist> and keys among them
inline constexpr std::size_t kPropertyListMaximumDepth = 64;             // elements inside each other

// None when the text is not exactly one number of that kind, or out of its range. White space around it is passed over.
[[nodiscard]] std::optional<std::int64_t> integerFromText(std::string_view text);
[[nodiscard]] std::optional<double> realFromText(std::string_view text);
// The shortest text that reads back as the same number. None for infinities and what is no number.
[[nodiscard]] std::optional<std::string> textFromReal(double value);

// Base 64. White space is passed over; the padding is required.
[[nodiscard]] std::optional<QXData> dataFromText(std::string_view text);
[[nodiscard]] std::string textFromData(const QXData& data);

// True for the white space of XML.
[[nodiscard]] constexpr bool isXMLSpace(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; }

}  // namespace docuvend::linux_platform
