#include "tests/attacks/attacker/Acts.h"

namespace docuvend::attacker {

Acts surroundingsActs() { return {}; }

}  // namespace docuvend::attacker
