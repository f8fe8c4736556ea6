// What the attacker can do: one act for each word, said on the command line with its operands. An act's outcome is one line: "ok", what it
// found, the name of an errno value, or the domain and code of an error.
#pragma once

#include <functional>
#include <map>
#include <string>
#include <vector>

namespace docuvend::attacker {

// The words of the command line from which acts take their operands. A missing one is empty.
class Words {
 public:
  explicit Words(std::vector<std::string> words) : words_(std::move(words)) {}
  [[nodiscard]] bool isAtEnd() const { return next_ == words_.size(); }
  std::string next() { return isAtEnd() ? std::string() : words_[next_++]; }

 private:
  const std::vector<std::string> words_;
  std::size_t next_ = 0;
};

using Act = std::function<std::string(Words&)>;
using Acts = std::map<std::string, Act>;

// "ok", or the name of errno's value when the system call's result is negative.
[[nodiscard]] std::string outcome(long result);

// By what they attack.
[[nodiscard]] Acts identityActs();
[[nodiscard]] Acts fileActs();
[[nodiscard]] Acts surroundingsActs();
[[nodiscard]] Acts pressureActs();
[[nodiscard]] Acts floodActs();
[[nodiscard]] Acts burdenActs();
[[nodiscard]] Acts pretenceActs();
[[nodiscard]] Acts mountActs();
[[nodiscard]] Acts sharedThingsActs();
[[nodiscard]] Acts untakenActs();

}  // namespace docuvend::attacker
