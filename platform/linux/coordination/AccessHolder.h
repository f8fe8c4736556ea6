// Who has or wants a file, as others may be told.
#pragma once

#include <optional>
#include <string>

namespace docuvend::linux_platform {

// By what accesses, changes and requests are counted: a bundle. All processes without one are as one.
using Application = std::optional<std::string>;

struct AccessHolder {
  int processIdentifier = 0;
  Application bundleIdentifier;  // of an application
};

}  // namespace docuvend::linux_platform
