// What an asker is told to do, word by word, and how it says what came of it.
#pragma once

#include <deque>
#include <string>
#include <utility>

#include "platform/QXURL.h"
#include "sdk/Result.h"

namespace docuvend::asker {

class Words {
 public:
  Words(int count, char** words) : words_(words + 1, words + count) {}
  [[nodiscard]] bool isEmpty() const { return words_.empty(); }
  // Empty when there is no more.
  std::string next() {
    if (words_.empty()) return {};
    std::string word = std::move(words_.front());
    words_.pop_front();
    return word;
  }
  QXURL nextURL() { return QXURL::fromString(next()).value_or(QXURL::fileURL("/", QXURLKind::directory)); }

 private:
  std::deque<std::string> words_;
};

inline std::string text(const QXError& error) {
  const std::string own = error.domain + " " + std::to_string(error.code);
  return error.underlying ? own + " < " + text(*error.underlying) : own;
}
inline std::string text(const Failure& failure) { return failure ? text(*failure) : "ok"; }

}  // namespace docuvend::asker
