// Reading what programs write to a terminal, from its other side.
#pragma once

#include <poll.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <string>

#include "tests/wire/Waiting.h"

namespace docuvend::tests {

// Waits for the next bytes and appends them; false when none come any more.
inline bool appendWhatComes(int terminal, std::string& text) {
  pollfd waiting{terminal, POLLIN, 0};
  int ready = 0;
  do {
    ready = ::poll(&waiting, 1, static_cast<int>(std::chrono::milliseconds(kPatience).count()));
  } while (ready < 0 && errno == EINTR);
  std::array<char, 4096> buffer;
  const ssize_t count = ready > 0 ? ::read(terminal, buffer.data(), buffer.size()) : -1;
  if (count <= 0) return false;
  text.append(buffer.data(), static_cast<std::size_t>(count));
  return true;
}

}  // namespace docuvend::tests
