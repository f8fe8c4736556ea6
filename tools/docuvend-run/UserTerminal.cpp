#include "tools/docuvend-run/UserTerminal.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <string>

namespace docuvend {
namespace {

using linux_platform::UniqueDescriptor;

// An opening of its own, so that waiting is nobody else's business; where the terminal is another user's a copy has to do.
UniqueDescriptor openAgain(int descriptor, int access) {
  const std::string path = "/proc/self/fd/" + std::to_string(descriptor);
  UniqueDescriptor opened(::open(path.c_str(), access | O_NOCTTY | O_NONBLOCK | O_CLOEXEC));
  return opened ? std::move(opened) : UniqueDescriptor(::fcntl(descriptor, F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
}

}  // namespace

UserTerminal::UserTerminal() {
  for (const int descriptor : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (::isatty(descriptor) == 1) replaced_.push_back(descriptor);
  }
  if (isTerminal(STDIN_FILENO)) input_ = openAgain(STDIN_FILENO, O_RDONLY);
  for (const int descriptor : {STDOUT_FILENO, STDERR_FILENO, STDIN_FILENO}) {
    if (!output_ && isTerminal(descriptor)) output_ = openAgain(descriptor, O_WRONLY);
  }
}

bool UserTerminal::isTerminal(int descriptor) const { return std::find(replaced_.begin(), replaced_.end(), descriptor) != replaced_.end(); }

bool UserTerminal::isInFront() const { return input_ && ::tcgetpgrp(input_.get()) == ::getpgrp(); }

void UserTerminal::enterRawMode() {
  termios modes{};
  if (!input_ || ::tcgetattr(input_.get(), &modes) != 0) return;
  // It may have been changed since: a process that was stopped by SIGSTOP could not leave raw mode.
  if (!found_) found_ = modes;
  modes = *found_;
  modes.c_iflag &= ~static_cast<tcflag_t>(BRKINT | IGNBRK | PARMRK | ISTRIP | INLCR | IGNCR | ICRNL | IXON);
  modes.c_lflag &= ~static_cast<tcflag_t>(ECHO | ECHONL | ICANON | IEXTEN);
  // Others of a pipeline may write there too, and the application's own terminal leaves its lines alone then.
  if (isTerminal(STDOUT_FILENO)) modes.c_oflag &= ~static_cast<tcflag_t>(OPOST);
  modes.c_cc[VMIN] = 0;
  modes.c_cc[VTIME] = 0;
  ::tcsetattr(input_.get(), TCSANOW, &modes);
}

void UserTerminal::leaveRawMode() {
  if (found_ && isInFront()) ::tcsetattr(input_.get(), TCSANOW, &*found_);
  found_.reset();
}

std::optional<termios> UserTerminal::modesForApplication() const {
  termios modes{};
  if (::tcgetattr(output_.get(), &modes) != 0) return std::nullopt;
  if (!isTerminal(STDIN_FILENO) || !isTerminal(STDOUT_FILENO)) {
    modes.c_oflag &= ~static_cast<tcflag_t>(OPOST);
    return modes;
  }
  return isInFront() ? std::optional(modes) : std::nullopt;
}

std::optional<winsize> UserTerminal::size() const {
  winsize size{};
  if (::ioctl(output_.get(), TIOCGWINSZ, &size) != 0) return std::nullopt;
  return size;
}

}  // namespace docuvend
