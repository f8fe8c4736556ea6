// Who has or wants a file, as others may be told.
#pragma once

#include <optional>
#include <string>

namespace docuvend::linux_platform {

struct AccessHolder {
  int processIdentifier = 0;
  std::optional<std::string> bundleIdentifier;  // of an application; all processes without one are as one
};

}  // namespace docuvend::linux_platform
