// What was asked on the command line.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace docuvend::ctl {

enum class OutputForm { text, json };

struct CommandLine {
  std::optional<std::string> actAs;
  OutputForm form = OutputForm::text;
  std::optional<std::chrono::milliseconds> deadline;
  std::string command;
  std::vector<std::string> operands;
};

struct HelpWanted {};
struct UsageError {
  std::string text;  // one line
};

[[nodiscard]] std::variant<CommandLine, HelpWanted, UsageError> parseCommandLine(int count, char** arguments);

}  // namespace docuvend::ctl
