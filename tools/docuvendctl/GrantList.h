// Grants as an answer.
#pragma once

#include <vector>

#include "sdk/Administrator.h"
#include "tools/docuvendctl/Answer.h"

namespace docuvend::ctl {

// The columns are "provider", "item" and "consumer", in the order in which `revoke` takes them.
[[nodiscard]] List listOf(const std::vector<Grant>& grants);

}  // namespace docuvend::ctl
