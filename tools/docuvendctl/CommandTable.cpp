#include "tools/docuvendctl/CommandTable.h"

#include <limits>
#include <sstream>
#include <string>

namespace docuvend::ctl {

const CommandTable& CommandTable::all() {
  static const CommandTable table({documentCommands(), itemCommands(), coordinationCommands(), administrationCommands(), bundleCommands(),
                                   platformCommands(), generalCommands()});
  return table;
}

const Command* CommandTable::find(std::string_view name) const {
  for (const CommandGroup& group : groups_) {
    for (const Command& command : group.commands) {
      if (command.name == name) return &command;
    }
  }
  return nullptr;
}

bool CommandTable::isFirstWord(std::string_view word) const {
  const std::string beginning = std::string(word) + " ";
  for (const CommandGroup& group : groups_) {
    for (const Command& command : group.commands) {
      if (command.name.starts_with(beginning)) return true;
    }
  }
  return false;
}

OperandCount operandCount(const Command& command) {
  OperandCount count;
  std::istringstream words{std::string(command.operands)};
  for (std::string word; words >> word;) {
    count.most = word.find("...") == std::string::npos ? count.most + 1 : std::numeric_limits<std::size_t>::max();
    if (!word.starts_with('[')) ++count.least;
  }
  return count;
}

}  // namespace docuvend::ctl
