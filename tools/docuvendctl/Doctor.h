// Which protections are in force on this machine, and which are not and why.
#pragma once

#include "sdk/Result.h"
#include "tools/docuvendctl/Answer.h"
#include "tools/docuvendctl/Command.h"

namespace docuvend::ctl {

// Never fails for what it finds: that is its answer.
[[nodiscard]] Result<Answer> doctor(const Call& call);

}  // namespace docuvend::ctl
