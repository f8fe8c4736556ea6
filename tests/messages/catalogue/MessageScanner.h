// Finds the messages in a source file: the literals that begin with a level in brackets. A format (platform/QXLogMessage.h) is nothing but
// such a literal, and a source that writes to the log without one is refused, so there is no other way to write a message.
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

// In the order of the source. Adjacent literals are one. What follows a message in a call is its values, and a literal among them stands in
// the text as it is. Comments are no source. Throws std::invalid_argument, with the line, for a call with another number of values than
// places, for a message that is put together with "+", and for a call of a log's `write`.
[[nodiscard]] std::vector<ScannedMessage> messagesIn(std::string_view source);

}  // namespace docuvend::tests
