// How a command ends: the exit status that says what kind of failure it was, and the failures that are docuvendctl's own.
#pragma once

#include <cstdint>
#include <string>

#include "platform/QXError.h"

namespace docuvend::ctl {

// Scripts rely on the numbers; --help lists them.
enum class ExitStatus {
  done = 0,
  usage = 2,
  notPermitted = 3,
  notFound = 4,
  providerFailed = 5,
  invalidInput = 6,
  unreachable = 7,
  deadlinePassed = 8,
  fileError = 9,
  other = 10,
  protectionMissing = 11,
  nothingStarts = 12,
};

inline constexpr const char* kControlErrorDomain = "DVControlErrorDomain";
enum class ControlErrorCode : std::int64_t {
  usage = 1,     // the command line is wrong
  confined = 2,  // asked from inside a confinement, where it cannot be done
};

[[nodiscard]] QXError makeControlError(ControlErrorCode code, std::string description);

[[nodiscard]] ExitStatus statusOf(const QXError& error);

// One line for a person: docuvendctl's own failures need no domain and no code.
[[nodiscard]] std::string messageOf(const QXError& error);

}  // namespace docuvend::ctl
