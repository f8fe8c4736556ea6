// How a command ends: what it prints and the exit status that says what kind of failure it was.
#pragma once

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
};

[[nodiscard]] ExitStatus statusOf(const QXError& error);

}  // namespace docuvend::ctl
