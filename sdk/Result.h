// How the consumer library answers: a value or an error, or nothing or an error.
#pragma once

#include <optional>
#include <variant>

#include "platform/QXError.h"

namespace docuvend {

template <class T>
using Result = std::variant<T, QXError>;
// None: done.
using Failure = std::optional<QXError>;

}  // namespace docuvend
