// docuvendctl: Docuvend from a shell.
#include "tools/docuvendctl/Run.h"

int main(int count, char** words) { return static_cast<int>(docuvend::ctl::run({words + 1, words + count})); }
