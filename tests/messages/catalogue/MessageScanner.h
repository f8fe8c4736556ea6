// Finds the messages in a source file: the literals that begin with a level in brackets. `dvLog` takes nothing but such a literal, so there
// is no other way to write a message.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace docuvend::tests {

struct ScannedMessage {
  std::string text;  // with "%@" in the place of each value that only a running program knows
  int line = 0;

  friend bool operator==(const ScannedMessage&, const ScannedMessage&) = default;
};

// In the order of the source. Adjacent literals are one. A literal among the values of a `dvLog` stands in the text as it is. Comments are
// no source. Throws std::invalid_argument, with the line, for a call of `dvLog` whose values are not as many as its placeholders.
[[nodiscard]] std::vector<ScannedMessage> messagesIn(std::string_view source);

}  // namespace docuvend::tests
