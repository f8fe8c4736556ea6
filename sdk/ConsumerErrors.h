// Errors that the consumer library makes itself. Every other error is the daemon's answer as it came.
#pragma once

#include <cstdint>
#include <string>
#include <utility>

#include "platform/QXError.h"

namespace docuvend {

inline constexpr const char* kConsumerErrorDomain = "DVConsumerErrorDomain";

enum class ConsumerErrorCode : std::int64_t {
  unreachable = 1,     // the daemon cannot be connected to; nothing was asked
  deadlinePassed = 2,  // no answer in time; what was asked may still take effect
  noAnswer = 3,        // the answer carried neither a value nor an error
  noToken = 4,         // the platform issued no token for the file
  connectionLost = 5,  // the daemon left after it was asked and before it answered; what was asked may have taken effect
};

[[nodiscard]] inline QXError makeConsumerError(ConsumerErrorCode code, std::string description) {
  return QXError::make(kConsumerErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

}  // namespace docuvend
