// How many columns of a terminal a text takes.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace docuvend::ctl {

// The text is well-formed UTF-8 without control characters.
[[nodiscard]] std::size_t textWidth(std::string_view text);

// The text when it takes no more than that many columns; else as much of its front as leaves room for an ellipsis. A width of zero
// leaves nothing.
[[nodiscard]] std::string cutToWidth(std::string_view text, std::size_t width);

// The text and so many spaces that together they take that many columns.
[[nodiscard]] std::string filledToWidth(std::string text, std::size_t width);

}  // namespace docuvend::ctl
