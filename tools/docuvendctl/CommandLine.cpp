#include "tools/docuvendctl/CommandLine.h"

#include <getopt.h>

#include <charconv>
#include <cstring>

namespace docuvend::ctl {
namespace {

constexpr int kLongestDeadlineSeconds = 86'400;

std::optional<std::chrono::milliseconds> parseSeconds(const char* text) {
  int seconds = 0;
  const char* end = text + std::strlen(text);
  const auto [stopped, error] = std::from_chars(text, end, seconds);
  if (error != std::errc{} || stopped != end || seconds < 1 || seconds > kLongestDeadlineSeconds) return std::nullopt;
  return std::chrono::seconds(seconds);
}

}  // namespace

std::variant<CommandLine, HelpWanted, UsageError> parseCommandLine(int count, char** arguments) {
  static constexpr option kOptions[] = {
      {"as", required_argument, nullptr, 'a'},
      {"json", no_argument, nullptr, 'j'},
      {"timeout", required_argument, nullptr, 't'},
      {"help", no_argument, nullptr, 'h'},
      {nullptr, 0, nullptr, 0},
  };
  CommandLine line;
  opterr = 0;
  optind = 1;
  for (int found = 0; (found = ::getopt_long(count, arguments, "+:h", kOptions, nullptr)) != -1;) {
    switch (found) {
      case 'a':
        line.actAs = optarg;
        break;
      case 'j':
        line.form = OutputForm::json;
        break;
      case 't':
        line.deadline = parseSeconds(optarg);
        if (!line.deadline) return UsageError{"--timeout takes a number of seconds from 1 to " + std::to_string(kLongestDeadlineSeconds)};
        break;
      case 'h':
        return HelpWanted{};
      case ':':
        return UsageError{std::string(arguments[optind - 1]) + " needs a value"};
      default:
        return UsageError{std::string("unknown option ") + arguments[optind - 1]};
    }
  }
  if (optind >= count) return UsageError{"no command given; --help lists them"};
  line.command = arguments[optind++];
  line.operands.assign(arguments + optind, arguments + count);
  return line;
}

}  // namespace docuvend::ctl
