#include "tools/docuvendctl/Terminal.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>

namespace docuvend::ctl {

bool isTerminal(int descriptor) { return ::isatty(descriptor) == 1; }

std::size_t terminalWidth(int descriptor) {
  constexpr std::size_t kUsual = 80;
  constexpr std::size_t kLeast = 2;
  winsize size{};
  if (::ioctl(descriptor, TIOCGWINSZ, &size) != 0 || size.ws_col == 0) return kUsual;
  return std::max<std::size_t>(size.ws_col, kLeast);
}

}  // namespace docuvend::ctl
