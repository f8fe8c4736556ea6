// How errors are printed: the domain and the code, of the error and of what stands beneath it; "ok" when there is none.
#pragma once

#include <optional>
#include <string>

#include "platform/QXError.h"

namespace docuvend::tests {

[[nodiscard]] inline std::string told(const QXError& error) {
  const std::string own = error.domain + " " + std::to_string(error.code);
  return error.underlying ? own + " < " + told(*error.underlying) : own;
}
[[nodiscard]] inline std::string told(const std::optional<QXError>& error) { return error ? told(*error) : "ok"; }

}  // namespace docuvend::tests
