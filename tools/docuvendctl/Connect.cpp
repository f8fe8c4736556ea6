#include "tools/docuvendctl/Connect.h"

#include <utility>

namespace docuvend::ctl {

Result<std::unique_ptr<Consumer>> connectConsumer(const std::optional<std::string>& actAs, Deadline deadline) {
  Consumer::Options options;
  options.actAs = actAs;
  if (deadline) options.deadline = options.materialisingDeadline = *deadline;
  return Consumer::connect(std::move(options));
}

Result<std::unique_ptr<Administrator>> connectAdministrator(Deadline deadline) {
  Administrator::Options options;
  if (deadline) options.deadline = *deadline;
  return Administrator::connect(options);
}

}  // namespace docuvend::ctl
