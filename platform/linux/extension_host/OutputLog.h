// Brings what a process writes to its outputs into the log, line by line, at the info type: "[INFO] NAME: LINE".
//
// Whatever it writes is taken, so that it is never held up, but of a flood only a part is logged (LineAllowance.h); how much was left
// out is told with a later line, or at the end: "[INFO] NAME wrote 12345 lines more than are logged."
#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

class OutputLog {
 public:
  static constexpr std::size_t kLinesAtOnce = 100;
  static constexpr std::chrono::milliseconds kTimeForALine{100};

  // Takes the reading end of a pipe, which does not block.
  OutputLog(Reactor& reactor, QXLogHandle& log, std::string name, UniqueDescriptor pipe);
  // Logs what is in the pipe.
  ~OutputLog();

  // False: nothing is read before the end.
  [[nodiscard]] bool isUsable() const { return registration_ != nullptr; }

  OutputLog(const OutputLog&) = delete;
  OutputLog& operator=(const OutputLog&) = delete;

 private:
  struct State;
  std::shared_ptr<State> state_;
  std::shared_ptr<Reactor::Registration> registration_;  // goes first: it watches a descriptor of the state
};

}  // namespace docuvend::linux_platform
