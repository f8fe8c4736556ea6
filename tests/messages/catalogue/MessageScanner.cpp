#include "tests/messages/catalogue/MessageScanner.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <cstddef>
#include <optional>
#include <stdexcept>
#include <utility>

#include "platform/QXLogMessage.h"

namespace docuvend::tests {
namespace {

constexpr std::array<std::string_view, 3> kPlaceholders{"%@", "%s", "%d"};
constexpr std::string_view kValue = "%@";
constexpr char kDigitSeparator = '\'';

struct Token {
  enum class Kind { literal, word, sign };

  Kind kind;
  std::string text;  // of a literal what it stands for, without quotes
  int line;
};

// Comments and white space fall away, adjacent literals become one.
class Tokens {
 public:
  explicit Tokens(std::string_view source) : rest_(source) {
    while (skipBlanks()) take();
  }
  [[nodiscard]] const std::vector<Token>& all() const { return tokens_; }

 private:
  void advance(std::size_t count) {
    line_ += static_cast<int>(std::count(rest_.begin(), rest_.begin() + static_cast<std::ptrdiff_t>(count), '\n'));
    rest_.remove_prefix(count);
  }
  void advancePast(std::string_view end) {
    advance(std::min(rest_.size(), rest_.find(end) == rest_.npos ? rest_.size() : rest_.find(end) + end.size()));
  }

  // False at the end.
  bool skipBlanks() {
    while (!rest_.empty()) {
      if (std::isspace(static_cast<unsigned char>(rest_.front())) != 0) {
        advance(1);
      } else if (rest_.starts_with("//")) {
        advancePast("\n");
      } else if (rest_.starts_with("/*")) {
        advancePast("*/");
      } else {
        return true;
      }
    }
    return false;
  }

  static bool isOfWord(char character) { return std::isalnum(static_cast<unsigned char>(character)) != 0 || character == '_'; }

  void take() {
    const int line = line_;
    if (rest_.front() == '"' || rest_.front() == '\'') {
      const bool isText = rest_.front() == '"';
      std::string text = quoted();
      const bool goesOn = isText && !tokens_.empty() && tokens_.back().kind == Token::Kind::literal;
      if (goesOn) {
        tokens_.back().text += text;
      } else {
        tokens_.push_back({isText ? Token::Kind::literal : Token::Kind::sign, std::move(text), line});
      }
      return;
    }
    const bool isNumber = std::isdigit(static_cast<unsigned char>(rest_.front())) != 0;
    const auto end =
        std::find_if_not(rest_.begin(), rest_.end(), [isNumber](char c) { return isOfWord(c) || (isNumber && c == kDigitSeparator); });
    const auto length = static_cast<std::size_t>(end - rest_.begin());
    tokens_.push_back(
        {length == 0 ? Token::Kind::sign : Token::Kind::word, std::string(rest_.substr(0, std::max<std::size_t>(length, 1))), line});
    advance(tokens_.back().text.size());
  }

  std::string quoted() {
    const char quote = rest_.front();
    advance(1);
    std::string text;
    while (rest_.size() > 1 && rest_.front() != quote) {
      if (rest_.front() == '\\') advance(1);
      text += rest_.front();
      advance(1);
    }
    if (rest_.empty() || rest_.front() != quote) throw std::invalid_argument("a literal without an end");
    advance(1);
    return text;
  }

  std::string_view rest_;
  int line_ = 1;
  std::vector<Token> tokens_;
};

bool hasLevel(const Token& token) { return token.kind == Token::Kind::literal && qxTypeOfLevel(token.text); }

// A level alone is what messages are recognised by, and none itself.
bool isMessage(const Token& token) { return hasLevel(token) && !token.text.ends_with("] "); }

bool isSign(const Token& token, std::string_view signs) {
  return token.kind == Token::Kind::sign && token.text.size() == 1 && signs.find(token.text.front()) != signs.npos;
}

bool isWord(const Token& token, std::string_view word) { return token.kind == Token::Kind::word && token.text == word; }

bool isInSum(const std::vector<Token>& tokens, std::size_t text) {
  return (text > 0 && isSign(tokens[text - 1], "+")) || (text + 1 < tokens.size() && isSign(tokens[text + 1], "+"));
}

// "log.write(", however the log is called and come by.
bool isWriteToALog(const std::vector<Token>& tokens, std::size_t at) {
  if (!isWord(tokens[at], "write") || at == 0 || !isSign(tokens[at - 1], ".>")) return false;
  std::size_t receiver = at - 1;
  while (receiver > 0 && tokens[receiver].kind == Token::Kind::sign) --receiver;
  return isWord(tokens[receiver], "log") || isWord(tokens[receiver], "log_") || isWord(tokens[receiver], "defaultLog");
}

// Whether the text is among what a function is called with.
bool isInCall(const std::vector<Token>& tokens, std::size_t text) {
  int depth = 0;
  for (std::size_t i = text; i-- > 0;) {
    if (isSign(tokens[i], ")]}")) ++depth;
    if (isSign(tokens[i], "([{") && depth-- == 0) return isSign(tokens[i], "(") && i > 0 && tokens[i - 1].kind == Token::Kind::word;
    if (depth == 0 && isSign(tokens[i], ";")) return false;
  }
  return false;
}

// The values that follow the text in a call: a literal, or nothing where only the running program knows it.
std::vector<std::optional<std::string>> valuesAfter(const std::vector<Token>& tokens, std::size_t text) {
  std::vector<std::optional<std::string>> values;
  int depth = 0;
  std::size_t length = 0;  // of the present value
  for (std::size_t i = text + 1; i < tokens.size() && depth >= 0; ++i) {
    const Token& token = tokens[i];
    if (isSign(token, "([{")) ++depth;
    if (isSign(token, ")]}")) --depth;
    if (depth < 0) break;
    if (depth == 0 && isSign(token, ",")) {
      values.emplace_back();
      length = 0;
      continue;
    }
    if (values.empty()) break;  // no call's text
    ++length;
    values.back() = length == 1 && token.kind == Token::Kind::literal ? std::optional(token.text) : std::nullopt;
  }
  return values;
}

std::optional<std::size_t> nextPlaceholder(std::string_view text, std::size_t from) {
  std::size_t next = text.npos;
  for (const std::string_view placeholder : kPlaceholders) next = std::min(next, text.find(placeholder, from));
  return next == text.npos ? std::nullopt : std::optional(next);
}

std::string filled(std::string text, const std::vector<std::optional<std::string>>& values) {
  std::size_t at = 0;
  for (const auto& value : values) {
    const auto placeholder = nextPlaceholder(text, at);
    if (!placeholder) throw std::invalid_argument("too many values");
    text.replace(*placeholder, kValue.size(), value ? *value : std::string(kValue));
    at = *placeholder + (value ? value->size() : kValue.size());
  }
  if (nextPlaceholder(text, at)) throw std::invalid_argument("too few values");
  return text;
}

std::string withoutKinds(std::string text) {
  for (auto next = nextPlaceholder(text, 0); next; next = nextPlaceholder(text, *next + kValue.size())) {
    text.replace(*next, kValue.size(), kValue);
  }
  return text;
}

}  // namespace

std::vector<ScannedMessage> messagesIn(std::string_view source) {
  const Tokens scanned(source);
  const std::vector<Token>& tokens = scanned.all();
  std::vector<ScannedMessage> messages;
  for (std::size_t i = 0; i < tokens.size(); ++i) {
    const auto refuse = [line = tokens[i].line](const std::string& why) {
      throw std::invalid_argument("line " + std::to_string(line) + ": " + why);
    };
    if (isWriteToALog(tokens, i)) refuse("a message that is not made of a format");
    if (hasLevel(tokens[i]) && isInSum(tokens, i)) refuse("a message that is put together");
    if (!isMessage(tokens[i])) continue;
    try {
      messages.push_back(
          {isInCall(tokens, i) ? filled(tokens[i].text, valuesAfter(tokens, i)) : withoutKinds(tokens[i].text), tokens[i].line});
    } catch (const std::invalid_argument& problem) {
      refuse(problem.what());
    }
  }
  return messages;
}

}  // namespace docuvend::tests
