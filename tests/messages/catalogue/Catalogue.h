// All messages that the sources can write, and what the tests' assertions leave to be desired.
//
// A text belongs to the message that fits it with the most characters of its own: "[DEBUG] %@" fits every debug text, and takes only
// those that nothing else fits. A message is asserted when a test has found it at its level's type, with a value in each place: present,
// not empty, and no two alike, so that no two values can be swapped unseen.
#pragma once

#include <iosfwd>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/fake/AssertedMessages.h"

namespace docuvend::tests {

struct MessageFindings {
  std::size_t asserted = 0;
  std::vector<std::string> unasserted;  // messages, with the places that write them and what was asserted of them instead
  std::vector<std::string> unknown;     // assertions of what no source writes, or at another type than the level's

  [[nodiscard]] bool areGood() const { return unasserted.empty() && unknown.empty(); }
};

class Catalogue {
 public:
  // Reads lines of a place, a tab and a text, as `write` makes them.
  [[nodiscard]] static Catalogue from(std::istream& stream);
  void write(std::ostream& stream) const;

  // Places of the same text are one message.
  void add(const std::string& place, const std::string& text);

  [[nodiscard]] std::size_t size() const { return messages_.size(); }
  [[nodiscard]] MessageFindings compare(const std::set<fake_platform::AssertedMessage>& asserted) const;

 private:
  [[nodiscard]] std::optional<std::string> owner(const std::string& text) const;

  std::map<std::string, std::vector<std::string>> messages_;  // a text: the places
};

// The values that turn the message into the text; none when it cannot be.
[[nodiscard]] std::optional<std::vector<std::string>> valuesOf(const std::string& message, const std::string& text);

}  // namespace docuvend::tests
