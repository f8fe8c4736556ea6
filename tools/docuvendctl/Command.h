// What a command is: a name, what it takes, what it does. The table of all of them is in CommandTable.h.
#pragma once

#include <chrono>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "sdk/Administrator.h"
#include "sdk/Consumer.h"
#include "tools/docuvendctl/Answer.h"

namespace docuvend::ctl {

// What was asked of a command.
struct Call {
  // As many as the command takes.
  std::vector<std::string> operands;
  // By the option's name; a switch's text is empty.
  std::map<std::string, std::string, std::less<>> options;
  std::optional<std::chrono::milliseconds> deadline;
  // Shows how far an item is; none when nobody watches.
  ProgressHandler progress;

  [[nodiscard]] bool has(std::string_view option) const { return options.contains(option); }
  [[nodiscard]] std::optional<std::string> option(std::string_view name) const {
    const auto found = options.find(name);
    return found == options.end() ? std::nullopt : std::optional(found->second);
  }
};

struct Option {
  std::string_view name;   // "--provider"
  std::string_view value;  // what it takes, "PROVIDER"; empty for a switch
  std::string_view help;
};

// A command says by its function whom it needs: the daemon as consumers see it, the daemon's administration, or nobody.
using ConsumerCommand = Result<Answer> (*)(Consumer& consumer, const Call& call);
using AdministratorCommand = Result<Answer> (*)(Administrator& administrator, const Call& call);
using LocalCommand = Result<Answer> (*)(const Call& call);

struct Command {
  std::string_view name;      // a word or two
  std::string_view operands;  // "URL PROVIDER", those that may be missing in brackets, "..." for any number
  std::vector<Option> options;
  std::string_view summary;  // one line
  std::string_view details;  // lines, each ended; what it prints, by name
  std::variant<ConsumerCommand, AdministratorCommand, LocalCommand> run;
};

// Commands of one concern.
struct CommandGroup {
  std::string_view title;
  std::vector<Command> commands;
};

}  // namespace docuvend::ctl
