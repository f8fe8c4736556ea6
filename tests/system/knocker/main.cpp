// knocker SOCKET REQUEST [WORD...]: asks the administration, and prints how that went (see ../knock.h).
#include <iostream>

#include "tests/system/knock.h"

int main(int count, char** words) {
  if (count < 3) return 2;
  std::cout << docuvend::tests::knock(words[1], {words + 2, words + count}) << "\n";
  return 0;
}
