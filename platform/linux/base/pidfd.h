// The C library's calls on pidfds. Its first header of them forgot that C++ exists.
#pragma once

extern "C" {
#include <sys/pidfd.h>
}
