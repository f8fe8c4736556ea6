#include "tools/docuvendctl/CommandLine.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cstddef>
#include <string_view>
#include <utility>

namespace docuvend::ctl {
namespace {

constexpr int kLongestDeadlineSeconds = 86'400;

std::optional<std::chrono::milliseconds> parseSeconds(std::string_view text) {
  int seconds = 0;
  const char* end = text.data() + text.size();
  const auto [stopped, error] = std::from_chars(text.data(), end, seconds);
  if (error != std::errc{} || stopped != end || seconds < 1 || seconds > kLongestDeadlineSeconds) return std::nullopt;
  return std::chrono::seconds(seconds);
}

const Option* find(const std::vector<Option>& options, std::string_view name) {
  const auto found = std::find_if(options.begin(), options.end(), [name](const Option& option) { return option.name == name; });
  return found == options.end() ? nullptr : &*found;
}

// Takes the words one by one, from left to right. Each step returns what is wrong, if anything.
class Parser {
 public:
  Parser(const std::vector<std::string>& words, const CommandTable& table) : words_(words), table_(table) {}

  std::variant<CommandLine, UsageError> run() {
    for (next_ = 0; next_ < words_.size() && !isTurnedAway_;) {
      if (auto problem = take(words_[next_++])) return UsageError{*std::move(problem), isJSONWanted()};
    }
    if (!isTurnedAway_) {
      if (auto problem = checkEnd()) return UsageError{*std::move(problem), isJSONWanted()};
    }
    return std::move(line_);
  }

 private:
  using Problem = std::optional<std::string>;

  Problem take(const std::string& word) {
    if (areOptionsOver_ || word.size() < 2 || word[0] != '-') return takePlain(word);
    if (word != "--") return takeOption(word);
    areOptionsOver_ = true;
    return std::nullopt;
  }

  Problem takePlain(const std::string& word) {
    if (line_.command != nullptr) {
      line_.call.operands.push_back(word);
      return std::nullopt;
    }
    name_ += name_.empty() ? word : " " + word;
    line_.command = table_.find(name_);
    isNameBegun_ = line_.command == nullptr && table_.isFirstWord(name_);
    if (line_.command == nullptr && !isNameBegun_) return "unknown command " + name_ + "; --help lists them";
    return std::nullopt;
  }

  Problem takeOption(const std::string& word) {
    const std::size_t equals = word.find('=');
    const std::string name = word.substr(0, equals);
    if (word == "--help" || word == "-h") return turnTo("help", line_.command == nullptr ? name_ : std::string(line_.command->name));
    if (word == "--version") return turnTo("version", {});
    const Option* option = find(commonOptions(), name);
    if (option == nullptr && line_.command != nullptr) option = find(line_.command->options, name);
    if (option == nullptr || (option->value.empty() && equals != std::string::npos)) {
      return "unknown option " + word + (line_.command == nullptr ? std::string() : " of " + std::string(line_.command->name));
    }
    std::string value;
    if (!option->value.empty()) {
      if (equals == std::string::npos && next_ == words_.size()) return name + " needs a value";
      value = equals == std::string::npos ? words_[next_++] : word.substr(equals + 1);
    }
    return apply(name, std::move(value));
  }

  Problem apply(const std::string& name, std::string value) {
    if (name == "--as") {
      line_.actAs = std::move(value);
    } else if (name == "--json") {
      line_.isJSONWanted = true;
    } else if (name == "--timeout") {
      line_.call.deadline = parseSeconds(value);
      if (!line_.call.deadline) return "--timeout takes a number of seconds from 1 to " + std::to_string(kLongestDeadlineSeconds);
    } else {
      line_.call.options[name] = std::move(value);
    }
    return std::nullopt;
  }

  // Whatever else was asked.
  Problem turnTo(std::string_view command, std::string operand) {
    isTurnedAway_ = true;
    line_.command = table_.find(command);
    line_.call = {};
    if (!operand.empty()) line_.call.operands.push_back(std::move(operand));
    line_.isJSONWanted = isJSONWanted();
    return std::nullopt;
  }

  Problem checkEnd() const {
    if (line_.command == nullptr)
      return isNameBegun_ ? name_ + " is half a command; --help lists them" : "no command given; --help lists them";
    const auto [least, most] = operandCount(*line_.command);
    const std::size_t count = line_.call.operands.size();
    return count < least || count > most ? Problem("usage: " + usageOf(*line_.command)) : std::nullopt;
  }

  // Also when the option stands behind what is wrong.
  [[nodiscard]] bool isJSONWanted() const {
    const auto end = std::find(words_.begin(), words_.end(), "--");
    return std::find(words_.begin(), end, "--json") != end;
  }

  const std::vector<std::string>& words_;
  const CommandTable& table_;
  std::size_t next_ = 0;
  bool areOptionsOver_ = false;
  bool isTurnedAway_ = false;
  bool isNameBegun_ = false;
  std::string name_;
  CommandLine line_;
};

}  // namespace

std::variant<CommandLine, UsageError> parseCommandLine(const std::vector<std::string>& words, const CommandTable& table) {
  return Parser(words, table).run();
}

const std::vector<Option>& commonOptions() {
  static const std::vector<Option> options = {
      {"--as", "BUNDLE", "act for an installed bundle (not from inside a confinement)"},
      {"--json", "", "print one JSON object or array; errors are one JSON object too"},
      {"--timeout", "SECONDS", "give up after that long; else after 30, and after 600 for a document or a turn at a file"},
  };
  return options;
}

std::string usageOf(const Command& command) {
  std::string usage = "docuvendctl ";
  usage.append(command.name);
  for (const Option& option : command.options) {
    usage.append(" [").append(option.name);
    if (!option.value.empty()) usage.append(" ").append(option.value);
    usage += "]";
  }
  if (!command.operands.empty()) usage.append(" ").append(command.operands);
  return usage;
}

}  // namespace docuvend::ctl
