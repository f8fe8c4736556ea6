// Says, in a program that loads it, that its code runs there.
#include <unistd.h>

namespace {

[[gnu::constructor]] void run() {
  constexpr char kText[] = "preloaded\n";
  if (::write(STDOUT_FILENO, kText, sizeof(kText) - 1) < 0) ::_exit(1);
}

}  // namespace
