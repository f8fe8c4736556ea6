#include "tools/docuvendctl/Place.h"

#include <unistd.h>

#include "platform/linux/base/confinement.h"
#include "tools/docuvendctl/Outcome.h"

namespace docuvend::ctl {

Result<linux_platform::Paths> unconfinedPaths() {
  if (::access(linux_platform::kDescriptionPath, F_OK) == 0) {
    return makeControlError(ControlErrorCode::confined, "this cannot be done from inside a confinement");
  }
  return linux_platform::Paths::fromEnvironment();
}

}  // namespace docuvend::ctl
