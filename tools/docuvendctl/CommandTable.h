// All commands. Each concern brings its own, from a source of its own.
#pragma once

#include <string_view>
#include <vector>

#include "tools/docuvendctl/Command.h"

namespace docuvend::ctl {

[[nodiscard]] CommandGroup documentCommands();
[[nodiscard]] CommandGroup itemCommands();
[[nodiscard]] CommandGroup coordinationCommands();
[[nodiscard]] CommandGroup administrationCommands();
[[nodiscard]] CommandGroup bundleCommands();
[[nodiscard]] CommandGroup platformCommands();
[[nodiscard]] CommandGroup generalCommands();

class CommandTable {
 public:
  // In the order in which they are explained.
  explicit CommandTable(std::vector<CommandGroup> groups) : groups_(std::move(groups)) {}

  [[nodiscard]] static const CommandTable& all();

  [[nodiscard]] const std::vector<CommandGroup>& groups() const { return groups_; }
  // Null when there is none of that name.
  [[nodiscard]] const Command* find(std::string_view name) const;
  // Some command's name begins with that word and goes on.
  [[nodiscard]] bool isFirstWord(std::string_view word) const;

 private:
  const std::vector<CommandGroup> groups_;
};

// How many operands the command takes.
struct OperandCount {
  std::size_t least = 0;
  std::size_t most = 0;
};
[[nodiscard]] OperandCount operandCount(const Command& command);

}  // namespace docuvend::ctl
