// An answer and a failure as JSON.
#pragma once

#include <string>

#include "platform/QXError.h"
#include "tools/docuvendctl/Answer.h"

namespace docuvend::ctl {

// One object, for a list an array of objects, in one line. Of a file's contents only the URL.
[[nodiscard]] std::string jsonText(const Answer& answer);

// {"error":{"domain":...,"code":...,"description":...}}
[[nodiscard]] std::string jsonText(const QXError& error);

// The text with quotes.
[[nodiscard]] std::string jsonString(const std::string& text);

}  // namespace docuvend::ctl
