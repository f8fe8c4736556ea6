// The words of turns at files.
//
//   bring STRING                 the token of a document is brought with every turn that is asked for from now on; prints the item's URL
//   bring-sibling STRING         the same with the token of its hidden sibling; prints the sibling's URL
//   within MILLISECONDS          the deadline of every turn that is asked for from now on
//   reading URL                  waits for a turn to read, and keeps it
//   writing URL                  the same to write
//   end                          ends the latest turn that it has
//   lost                         waits until the latest turn is not held any more
//   holders URL                  a line of who has or awaits the file, each as "reading holding own", with the process where it is told
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <vector>

#include "sdk/Consumer.h"
#include "tests/system/asker/Words.h"

namespace docuvend::asker {

class Turns {
 public:
  explicit Turns(Consumer& consumer) : consumer_(consumer) {}

  // None: not its word.
  std::optional<std::string> perform(const std::string& verb, Words& words);

 private:
  std::string bring(const std::string& string);
  std::string bringSibling(const std::string& string);
  std::string take(CoordinationKind kind, const QXURL& url);
  std::string end();
  std::string awaitLoss();
  std::string holders(const QXURL& url);

  Consumer& consumer_;
  CoordinationOptions options_;
  std::chrono::milliseconds deadline_ = Consumer::Options{}.materialisingDeadline;
  std::vector<CoordinatedAccess> turns_;
};

}  // namespace docuvend::asker
