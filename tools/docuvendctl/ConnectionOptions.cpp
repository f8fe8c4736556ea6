#include "tools/docuvendctl/ConnectionOptions.h"

namespace docuvend::ctl {

Consumer::Options consumerOptions(const std::optional<std::string>& actAs, std::optional<std::chrono::milliseconds> deadline) {
  Consumer::Options options;
  options.actAs = actAs;
  if (deadline) options.deadline = options.materialisingDeadline = *deadline;
  return options;
}

Administrator::Options administratorOptions(std::optional<std::chrono::milliseconds> deadline) {
  Administrator::Options options;
  if (deadline) options.deadline = *deadline;
  return options;
}

}  // namespace docuvend::ctl
