#include "tests/attacks/attacker/Acts.h"

namespace docuvend::attacker {

Acts identityActs() { return {}; }

}  // namespace docuvend::attacker
