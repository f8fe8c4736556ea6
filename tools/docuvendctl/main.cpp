// docuvendctl: the daemon's operations from a shell.
#include <csignal>
#include <iostream>

#include "platform/linux/log/LogText.h"
#include "tools/docuvendctl/Commands.h"

int main(int count, char** arguments) {
  using namespace docuvend::ctl;
  std::signal(SIGPIPE, SIG_IGN);
  const auto parsed = parseCommandLine(count, arguments);
  if (std::holds_alternative<HelpWanted>(parsed)) {
    std::cout << helpText();
    return 0;
  }
  if (const auto* error = std::get_if<UsageError>(&parsed)) {
    std::cerr << "docuvendctl: " << docuvend::linux_platform::visibleLogText(error->text) << "\n";
    return static_cast<int>(ExitStatus::usage);
  }
  return static_cast<int>(runCommand(std::get<CommandLine>(parsed)));
}
