// What a process has open and running, to be compared before and after.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>

#include "tests/system/house/Process.h"

namespace docuvend::tests {

struct Burden {
  std::size_t descriptors = 0;
  std::size_t processes = 0;  // all that descend from it, whatever they are called
  std::string memory;         // as the system says it
};

inline std::size_t descendantsOf(const std::string& process) {
  std::size_t result = 0;
  std::error_code ignored;
  for (const auto& task : std::filesystem::directory_iterator("/proc/" + process + "/task", ignored)) {
    std::istringstream children(contentsOf(task.path() / "children"));
    for (std::string child; children >> child;) result += 1 + descendantsOf(child);
  }
  return result;
}

[[nodiscard]] inline Burden burdenOf(pid_t process) {
  namespace fs = std::filesystem;
  const fs::path directory = "/proc/" + std::to_string(process);
  Burden result{static_cast<std::size_t>(std::distance(fs::directory_iterator(directory / "fd"), fs::directory_iterator())),
                descendantsOf(std::to_string(process)), "unknown"};
  std::ifstream status(directory / "status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with("VmRSS:")) result.memory = line;
  }
  return result;
}

}  // namespace docuvend::tests
