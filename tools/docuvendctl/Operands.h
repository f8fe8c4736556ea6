// What operands mean.
#pragma once

#include <string>

#include "sdk/Consumer.h"
#include "tools/docuvendctl/Answer.h"

namespace docuvend::ctl {

// A file URL, or the absolute path of a file.
[[nodiscard]] Result<QXURL> parseURL(const std::string& text);

// What a command answers that has nothing to say.
[[nodiscard]] Result<Answer> done(const Failure& failure);

// A document's URL and what opens it.
[[nodiscard]] Record recordOf(const Document& document);

}  // namespace docuvend::ctl
