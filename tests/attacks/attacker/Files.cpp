#include "tests/attacks/attacker/Acts.h"

namespace docuvend::attacker {

Acts fileActs() { return {}; }

}  // namespace docuvend::attacker
