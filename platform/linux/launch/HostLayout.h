// What a launch must know about the machine before it can plan.
#pragma once

#include <cstdint>
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
  std::optional<std::uint64_t> processes;  // this process's own limits, which a launch inherits; none where there is no limit
  std::optional<std::uint64_t> openFiles;
  std::optional<std::uint64_t> pendingSignals;
  std::optional<std::uint64_t> lockedMemory;  // bytes
  std::string bubblewrap;                     // absolute path; empty when it is not installed
  std::string helper;                         // absolute path of docuvend-confine; empty when it is not found

  [[nodiscard]] static HostLayout read();

  // Where every launch looks and the path lies: one of the system's directories and files, if the path, with all links followed, is that
  // or below it. What of the path does not exist yet is taken as it is written.
  [[nodiscard]] std::optional<std::string> shownAround(const std::string& path) const;
};

}  // namespace docuvend::linux_platform
