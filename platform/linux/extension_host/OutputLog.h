// Brings what a process writes to its outputs into the log, line by line, at the info type: "[INFO] NAME: LINE".
//
// Whatever it writes is taken, so that it is never held up, but of a flood only the beginning is logged (LineAllowance.h); how much was
// dropped is told with the next line that is logged, or at the end: "[INFO] NAME wrote 12345 lines more than are logged."
#pragma once

#include <memory>
#include <string>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

class OutputLog {
 public:
  // Takes the reading end of a pipe, which does not block.
  OutputLog(Reactor& reactor, QXLogHandle& log, std::string name, UniqueDescriptor pipe);
  // Logs what is in the pipe.
  ~OutputLog();
  OutputLog(const OutputLog&) = delete;
  OutputLog& operator=(const OutputLog&) = delete;

 private:
  struct State;
  std::shared_ptr<State> state_;
  std::shared_ptr<Reactor::Registration> registration_;  // goes first: it watches a descriptor of the state
};

}  // namespace docuvend::linux_platform
