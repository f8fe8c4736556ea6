// A program that a test starts: never waited for without a bound, and ended at the latest with its object.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::tests {

struct Command {
  std::vector<std::string> words;  // the absolute path of the program, then its arguments
  std::vector<std::string> environment;
  std::string input;
  // Where its standard error and its standard output go; files of their own when there are none.
  int errors = -1;
  int output = -1;
};

struct Ending {
  int status = -1;  // as a shell says it: 128 and the signal's number after a signal
  std::string output;
  std::string errors;
};

class Process {
 public:
  // Throws when it cannot be started: nothing can be tested then.
  explicit Process(const Command& command);
  ~Process();
  Process(const Process&) = delete;
  Process& operator=(const Process&) = delete;

  [[nodiscard]] pid_t pid() const { return pid_; }
  [[nodiscard]] bool isRunning();
  // Waits, for what may take longer than the tests' patience.
  [[nodiscard]] bool hasEndedWithin(int milliseconds) const;
  void signal(int number) const;
  // Waits for its end, at most for the tests' patience; it is killed then, and the test fails.
  const Ending& wait();

 private:
  pid_t pid_ = -1;
  linux_platform::UniqueDescriptor pidfd_;
  linux_platform::UniqueDescriptor output_;
  linux_platform::UniqueDescriptor errors_;
  std::optional<Ending> ending_;
};

// All that a file holds.
[[nodiscard]] std::string contentsOf(const std::string& path);

}  // namespace docuvend::tests
