// A terminal that a test looks at: what a program writes to it arrives byte for byte.
#pragma once

#include <gtest/gtest.h>
#include <pty.h>
#include <termios.h>
#include <unistd.h>

#include <stdexcept>
#include <string>

#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/support/TerminalReading.h"

namespace docuvend::tests {

class PseudoTerminal {
 public:
  explicit PseudoTerminal(unsigned short columns) {
    int master = -1;
    int slave = -1;
    termios settings{};
    ::cfmakeraw(&settings);
    const winsize size{24, columns, 0, 0};
    if (::openpty(&master, &slave, nullptr, &settings, &size) != 0) throw std::runtime_error("no terminal for a test");
    master_.reset(master);
    slave_.reset(slave);
  }

  // What a program gets.
  [[nodiscard]] int descriptor() const { return slave_.get(); }

  // Reads until the text has come. False, and a test failure, when it never does.
  bool await(const std::string& text) {
    while (written_.find(text) == std::string::npos) {
      if (!readSome()) {
        ADD_FAILURE() << "the terminal never showed: " << text << "; but: " << written_;
        return false;
      }
    }
    return true;
  }

  // All that was written, once every program that had the terminal has ended.
  const std::string& finished() {
    slave_.reset();
    while (readSome()) continue;
    return written_;
  }

 private:
  bool readSome() { return appendWhatComes(master_.get(), written_); }

  linux_platform::UniqueDescriptor master_;
  linux_platform::UniqueDescriptor slave_;
  std::string written_;
};

}  // namespace docuvend::tests
