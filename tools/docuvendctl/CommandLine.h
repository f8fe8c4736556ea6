// What was asked on the command line. Options that every command takes may stand anywhere; a command's own stand behind its name; behind
// "--" everything is an operand.
#pragma once

#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "tools/docuvendctl/Command.h"
#include "tools/docuvendctl/CommandTable.h"

namespace docuvend::ctl {

struct CommandLine {
  const Command* command = nullptr;  // one of the table's
  Call call;
  std::optional<std::string> actAs;
  bool isJSONWanted = false;
};

struct UsageError {
  std::string text;  // one line
  bool isJSONWanted = false;
};

// "--help" and "--version" become the commands of that name.
[[nodiscard]] std::variant<CommandLine, UsageError> parseCommandLine(const std::vector<std::string>& words, const CommandTable& table);

// What every command takes.
[[nodiscard]] const std::vector<Option>& commonOptions();
// "docuvendctl grants [--provider PROVIDER] [--consumer CONSUMER]"
[[nodiscard]] std::string usageOf(const Command& command);

}  // namespace docuvend::ctl
