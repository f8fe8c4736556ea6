// The terminal that docuvend-run was started at, while an application has one of its own instead: who may read it now, and its modes.
// For one thread, with SIGTTIN and SIGTTOU blocked once it reads or enters raw mode. What fails leaves the terminal as it is.
#pragma once

#include <sys/ioctl.h>
#include <termios.h>

#include <optional>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend {

class UserTerminal {
 public:
  // Looks at descriptors 0 to 2.
  UserTerminal();
  UserTerminal(const UserTerminal&) = delete;
  UserTerminal& operator=(const UserTerminal&) = delete;
  ~UserTerminal() { leaveRawMode(); }

  // Those of descriptors 0 to 2 that are a terminal.
  [[nodiscard]] const std::vector<int>& replaced() const { return replaced_; }
  // Where somebody types; -1 when standard input is no terminal. A read of it does not wait in raw mode.
  [[nodiscard]] int input() const { return input_.get(); }
  // The first that is a terminal of standard output, error and input.
  [[nodiscard]] int output() const { return output_.get(); }

  // It controls this process's session, and this process's group is in front: what is typed is meant for it.
  [[nodiscard]] bool isInFront() const;
  // Passes everything that is typed on but the signals' characters, which stay the user's. Nothing to do where nobody types.
  void enterRawMode();
  // Puts back what was found, unless the terminal is somebody else's by now.
  void leaveRawMode();

  // What an application's own terminal starts with; none where what is set now is for whoever is in front.
  [[nodiscard]] std::optional<termios> modesForApplication() const;
  [[nodiscard]] std::optional<winsize> size() const;

 private:
  [[nodiscard]] bool isTerminal(int descriptor) const;

  std::vector<int> replaced_;
  linux_platform::UniqueDescriptor input_;
  linux_platform::UniqueDescriptor output_;
  std::optional<termios> found_;  // while in raw mode
};

}  // namespace docuvend
