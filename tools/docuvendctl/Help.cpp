#include "tools/docuvendctl/Help.h"

#include <algorithm>
#include <string_view>

#include "tools/docuvendctl/CommandLine.h"
#include "tools/docuvendctl/Outcome.h"

namespace docuvend::ctl {
namespace {

constexpr std::size_t kIndent = 2;

constexpr std::string_view kIntroduction =
    "docuvendctl [--as BUNDLE] [--json] [--timeout SECONDS] COMMAND [OPERAND...]\n"
    "\n"
    "Asks the Docuvend daemon of this user. URL is a file URL or an absolute path, STRING what bookmark prints, PROVIDER, CONSUMER and\n"
    "BUNDLE are bundle identifiers.\n";

constexpr std::string_view kOutput =
    "\n"
    "On a terminal lists are tables. Otherwise a list is one line for each of its rows, with tabs between the values; of one thing there "
    "is\n"
    "one line for each name and value, with a tab between; a backslash, tab or line feed in a value is written \\\\, \\t or \\n.\n";

constexpr std::string_view kStatuses =
    "\n"
    "Exit status: 0 done, 2 usage, 3 not permitted, 4 not found, 5 the provider failed, 6 invalid input, 7 the daemon cannot be reached,\n"
    "8 no answer in time, 9 a file could not be used, 10 anything else; of doctor also 11 a protection is missing, 12 nothing can be\n"
    "started.\n";

using Entries = std::vector<std::pair<std::string, std::string_view>>;

// Two columns.
std::string entriesText(const Entries& entries, std::size_t width) {
  std::string text;
  for (const auto& [name, help] : entries) {
    std::string line(kIndent, ' ');
    line += name;
    line.resize(std::max(line.size(), kIndent + width), ' ');
    text.append(line).append("  ").append(help).append("\n");
  }
  return text;
}

std::size_t widthOf(const Entries& entries) {
  std::size_t width = 0;
  for (const auto& entry : entries) width = std::max(width, entry.first.size());
  return width;
}

Entries entriesOf(const std::vector<Option>& options) {
  Entries entries;
  for (const Option& option : options) {
    std::string name(option.name);
    if (!option.value.empty()) name.append(" ").append(option.value);
    entries.emplace_back(std::move(name), option.help);
  }
  return entries;
}

Entries entriesOf(const CommandGroup& group) {
  Entries entries;
  for (const Command& command : group.commands) {
    std::string name(command.name);
    if (!command.operands.empty()) name.append(" ").append(command.operands);
    entries.emplace_back(std::move(name), command.summary);
  }
  return entries;
}

std::string overview(const CommandTable& table) {
  std::string text(kIntroduction);
  std::size_t width = 0;
  for (const CommandGroup& group : table.groups()) width = std::max(width, widthOf(entriesOf(group)));
  for (const CommandGroup& group : table.groups()) {
    text.append("\n").append(group.title).append("\n").append(entriesText(entriesOf(group), width));
  }
  Entries options = entriesOf(commonOptions());
  options.emplace_back("--help", "explain a command, or all");
  options.emplace_back("--version", "print this program's version");
  text.append("\nOptions\n").append(entriesText(options, width));
  return text.append(kOutput).append(kStatuses);
}

std::string explanation(const Command& command) {
  std::string text = usageOf(command) + "\n\n";
  std::string summary(command.summary);
  summary.front() = static_cast<char>(std::toupper(static_cast<unsigned char>(summary.front())));
  text.append(summary).append(".\n").append(command.details);
  const Entries options = entriesOf(command.options);
  if (!options.empty()) text.append("\n").append(entriesText(options, widthOf(options)));
  return text;
}

}  // namespace

Result<std::string> helpText(const CommandTable& table, const std::string& name) {
  if (name.empty()) return overview(table);
  if (const Command* command = table.find(name)) return explanation(*command);
  std::string text;
  for (const CommandGroup& group : table.groups()) {
    for (const Command& command : group.commands) {
      if (!command.name.starts_with(name + " ")) continue;
      text.append(text.empty() ? "" : "\n").append(explanation(command));
    }
  }
  if (text.empty()) return makeControlError(ControlErrorCode::usage, "unknown command " + name + "; --help lists them");
  return text;
}

}  // namespace docuvend::ctl
