#include "tools/docuvendctl/CommandLine.h"

#include <getopt.h>

#include <charconv>
#include <cstring>

namespace docuvend::ctl {
namespace {

constexpr int kLongestDeadlineSeconds = 86'400;

// Beside those that are one character.
enum LongOption { as = 256, json, timeout };

std::optional<std::chrono::milliseconds> parseSeconds(const char* text) {
  int seconds = 0;
  const char* end = text + std::strlen(text);
  const auto [stopped, error] = std::from_chars(text, end, seconds);
  if (error != std::errc{} || stopped != end || seconds < 1 || seconds > kLongestDeadlineSeconds) return std::nullopt;
  return std::chrono::seconds(seconds);
}

// As it was given; of several characters behind one dash the one that is meant.
std::string unknownOption(char** arguments) {
  const bool isOneCharacter = optopt > 0 && optopt < LongOption::as;
  return isOneCharacter ? std::string("-") + static_cast<char>(optopt) : arguments[optind - 1];
}

}  // namespace

std::variant<CommandLine, HelpWanted, UsageError> parseCommandLine(int count, char** arguments) {
  static constexpr option kOptions[] = {
      {"as", required_argument, nullptr, LongOption::as},
      {"json", no_argument, nullptr, LongOption::json},
      {"timeout", required_argument, nullptr, LongOption::timeout},
      {"help", no_argument, nullptr, 'h'},
      {nullptr, 0, nullptr, 0},
  };
  CommandLine line;
  opterr = 0;
  optind = 0;  // from the beginning, whatever was read before
  for (int found = 0; (found = ::getopt_long(count, arguments, "+:h", kOptions, nullptr)) != -1;) {
    switch (found) {
      case LongOption::as:
        line.actAs = optarg;
        break;
      case LongOption::json:
        line.form = OutputForm::json;
        break;
      case LongOption::timeout:
        line.deadline = parseSeconds(optarg);
        if (!line.deadline) return UsageError{"--timeout takes a number of seconds from 1 to " + std::to_string(kLongestDeadlineSeconds)};
        break;
      case 'h':
        return HelpWanted{};
      case ':':
        return UsageError{std::string(arguments[optind - 1]) + " needs a value"};
      default:
        return UsageError{"unknown option " + unknownOption(arguments)};
    }
  }
  if (optind >= count) return UsageError{"no command given; --help lists them"};
  line.command = arguments[optind++];
  line.operands.assign(arguments + optind, arguments + count);
  return line;
}

}  // namespace docuvend::ctl
