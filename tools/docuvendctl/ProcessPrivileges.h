// What a process may do, as the kernel's page about it says.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace docuvend::ctl {

struct ProcessPrivileges {
  bool hasNoNewPrivileges = false;
  bool hasCapabilities = false;
  bool isRoot = false;
  bool isInThisUserNamespace = false;  // in which it can recognise what is confined
};

// From the text of /proc/NUMBER/status; a namespace is not in it. None when a line is missing or malformed.
[[nodiscard]] std::optional<ProcessPrivileges> parsePrivileges(const std::string& text);

// None when the process is gone or cannot be looked at.
[[nodiscard]] std::optional<ProcessPrivileges> privilegesOf(std::int64_t process);

}  // namespace docuvend::ctl
