#include "tests/attacks/AttackTest.h"

#include <sstream>

namespace docuvend::tests {

std::vector<std::string> AttackTest::attack(const std::vector<std::string>& words) const {
  const Ending ending = house_.confined(kAttacker, words);
  EXPECT_EQ(ending.status, 0) << ending.errors;
  std::vector<std::string> lines;
  std::istringstream stream(ending.output);
  for (std::string line; std::getline(stream, line);) lines.push_back(line);
  return lines;
}

}  // namespace docuvend::tests
