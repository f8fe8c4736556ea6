// A shell with job control at a terminal of its own, at which a test types and looks. It leaves the terminal's modes to what it starts.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <pty.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <iterator>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/support/Eventually.h"
#include "tests/support/TerminalReading.h"

namespace docuvend::tests {

class ShellAtTerminal {
 public:
  explicit ShellAtTerminal(std::vector<std::string> environment) {
    environment.emplace_back("PS1=");
    std::vector<char*> entries;
    for (auto& entry : environment) entries.push_back(entry.data());
    entries.push_back(nullptr);
    int terminal = -1;
    const winsize size{24, 80, 0, 0};
    pid_ = ::forkpty(&terminal, nullptr, nullptr, &size);
    if (pid_ < 0) throw std::runtime_error("no shell for a test");
    if (pid_ == 0) {
      ::execle("/bin/dash", "dash", "-i", nullptr, entries.data());
      ::_exit(99);
    }
    terminal_.reset(terminal);
  }
  ShellAtTerminal(const ShellAtTerminal&) = delete;
  ShellAtTerminal& operator=(const ShellAtTerminal&) = delete;
  ~ShellAtTerminal() { end(); }

  void type(const std::string& text) const {
    EXPECT_EQ(::write(terminal_.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
  }
  // Reads on until the text has come. False, and a test failure, when it never does.
  bool await(const std::string& text) { return !textUntil(text).empty(); }
  // What came before that, since the last time, and the text.
  std::string textUntil(const std::string& text) {
    std::size_t at = 0;
    while ((at = shown_.find(text)) == std::string::npos) {
      if (!readSome()) {
        ADD_FAILURE() << "the terminal never showed: " << text << "; but: " << shown_;
        return {};
      }
    }
    const std::string found = shown_.substr(0, at + text.size());
    shown_.erase(0, found.size());
    return found;
  }

  [[nodiscard]] termios modes() const {
    termios modes{};
    EXPECT_EQ(::tcgetattr(terminal_.get(), &modes), 0);
    return modes;
  }
  // Are the characters passed on as they are typed?
  [[nodiscard]] bool isRaw() const { return (modes().c_lflag & (ICANON | ECHO)) == 0; }
  // TCOOFF: it takes nothing more, until TCOON.
  void flow(int action) const {
    const linux_platform::UniqueDescriptor side(::ioctl(terminal_.get(), TIOCGPTPEER, O_RDWR | O_NOCTTY | O_CLOEXEC));
    EXPECT_EQ(::tcflow(side.get(), action), 0);
  }
  void resize(unsigned short rows, unsigned short columns) const {
    const winsize size{rows, columns, 0, 0};
    EXPECT_EQ(::ioctl(terminal_.get(), TIOCSWINSZ, &size), 0);
  }

  // As if it had been killed.
  void end() {
    if (pid_ <= 0) return;
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
    pid_ = -1;
  }

 private:
  bool readSome() { return appendWhatComes(terminal_.get(), shown_); }

  pid_t pid_ = -1;
  linux_platform::UniqueDescriptor terminal_;
  std::string shown_;
};

// The same settings, field by field: the structure has room between them.
inline bool areEqual(const termios& one, const termios& other) {
  return one.c_iflag == other.c_iflag && one.c_oflag == other.c_oflag && one.c_cflag == other.c_cflag && one.c_lflag == other.c_lflag &&
         std::equal(std::begin(one.c_cc), std::end(one.c_cc), std::begin(other.c_cc));
}

}  // namespace docuvend::tests
