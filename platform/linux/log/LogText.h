// What a log line or a terminal shows of a text that nobody vouches for.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace docuvend::linux_platform {

// With a prefix the line stays below PIPE_BUF: written at once, it is never mixed with another's.
inline constexpr std::size_t kLongestLogText = 3840;

// The text with everything visible that could start a line, steer a terminal or reorder what is shown: control characters, line and
// paragraph separators and bytes that are no UTF-8 as "\n", "\x1b", "\u{202e}"; bidirectional controls too. All else, backslashes
// included, stays. The result is well-formed UTF-8.
[[nodiscard]] std::string visibleText(std::string_view text);

// The same, but when it is longer than kLongestLogText it is cut between two characters and says how many of the text's bytes are missing.
[[nodiscard]] std::string visibleLogText(std::string_view text);

}  // namespace docuvend::linux_platform
