// Errors that the consumer library makes itself. Every other error is the daemon's answer as it came.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
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
  notTold = 6,         // the document is saved, but its provider could not be told; why stands beneath
};

[[nodiscard]] inline QXError makeConsumerError(ConsumerErrorCode code, std::string description,
                                               const std::optional<QXError>& underlying = std::nullopt) {
  QXError error = QXError::make(kConsumerErrorDomain, static_cast<std::int64_t>(code), std::move(description));
  if (underlying) error.underlying = std::make_shared<const QXError>(*underlying);
  return error;
}

}  // namespace docuvend
