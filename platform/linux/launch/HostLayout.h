// What a launch must know about the machine before it can plan.
#pragma once

#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace docuvend::linux_platform {

struct HostLayout {
  std::vector<std::pair<std::string, std::string>> systemLinks;  // "/bin" to "usr/bin": made again inside
  std::vector<std::string> systemDirectories;                    // "/usr" and what a host has beside it: bound read-only
  std::vector<std::string> systemFiles;                          // what of /etc a program needs: bound read-only
  std::vector<std::string> networkFiles;                         // what of /etc a program with a network needs
  int landlockLevel = 0;
  std::string bubblewrap;  // absolute path; empty when it is not installed
  std::string helper;      // absolute path of docuvend-confine; empty when it is not found

  [[nodiscard]] static HostLayout read();
};

}  // namespace docuvend::linux_platform
