// What docuvend-confine is told to do, as its arguments say it. The launcher writes them, docuvend-confine reads them.
//
//   docuvend-confine [--read-execute PATH | --read PATH | --read-write PATH | --device PATH]... --descriptors COUNT
//                    [--processes COUNT] [--memory BYTES] [--open-files COUNT] [--pending-signals COUNT]
//                    [--locked-memory BYTES] [--leases taken] -- EXECUTABLE [ARGUMENT...]
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace docuvend::linux_platform {

enum class PathAccess {
  readExecute,
  read,
  readWrite,  // everything but executing and making device files
  device,     // one device file: reading and writing
};

// Whether a process may take leases for writing on files, which hold up everybody else who opens them. Other leases nobody may take.
enum class Leases { refused, taken };

// Bytes of POSIX message queues of whatever is confined: it makes none. The kernel counts them for the user, a launch could take them all,
// and nobody outside sees a queue that is made inside, where there are sockets as well.
inline constexpr std::uint64_t kConfinedMessageQueueBytes = 0;

struct ConfinePolicy {
  struct Rule {
    PathAccess access;
    std::string path;  // absolute; with everything below it
    friend bool operator==(const Rule&, const Rule&) = default;
  };

  std::vector<Rule> rules;  // what no rule names is out of reach
  int descriptors = 3;      // 0 to this number, exclusive, stay open; every other is closed
  std::optional<std::uint64_t> processes;
  std::optional<std::uint64_t> memory;     // bytes of private writable memory per process
  std::optional<std::uint64_t> openFiles;  // descriptors per process
  std::optional<std::uint64_t> pendingSignals;
  std::optional<std::uint64_t> lockedMemory;  // bytes
  Leases leases = Leases::refused;

  friend bool operator==(const ConfinePolicy&, const ConfinePolicy&) = default;
};

struct ConfineCommand {
  ConfinePolicy policy;
  std::vector<std::string> command;  // [0] is the absolute path of the executable
  friend bool operator==(const ConfineCommand&, const ConfineCommand&) = default;
};

// Without a program name in front.
[[nodiscard]] std::vector<std::string> confineArguments(const ConfineCommand& command);
// The reverse, or what is wrong in words.
[[nodiscard]] std::variant<ConfineCommand, std::string> parseConfineArguments(const std::vector<std::string>& arguments);

}  // namespace docuvend::linux_platform
