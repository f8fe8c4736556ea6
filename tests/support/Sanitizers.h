// Under a sanitizer everything takes several times as long, so what is tried often is tried less often.
#pragma once

#include "platform/linux/base/Sanitizers.h"

namespace docuvend::tests {

using linux_platform::kSanitized;
using linux_platform::kThreadSanitizer;

}  // namespace docuvend::tests
