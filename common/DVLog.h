// The system's one log.
//
//   dvLog("[INFO] Resolved URL to provider %@.", provider.identifier());
//
// What a message is made of: platform/QXLogMessage.h. It is made only when its type is enabled, and of a long value only the beginning is
// shown.
#pragma once

#include <cstddef>
#include <string>

#include "platform/QXLogMessage.h"

namespace docuvend {

[[nodiscard]] QXLogHandle& dv_default_log();

// Of one value in a message, in bytes: most values are what somebody else chose.
inline constexpr std::size_t kDVLongestLoggedValue = 1024;

// The text, or its beginning of whole characters and an ellipsis when it is longer than that.
[[nodiscard]] std::string dvShortened(std::string text);

// A value of which only the beginning is shown.
template <class Value>
struct DVShortened {
  const Value& value;
};

template <class Value>
[[nodiscard]] std::string qxDescribe(const DVShortened<Value>& shortened) {
  return dvShortened(qxDescribe(shortened.value));
}

template <class... Values>
void dvLog(QXLogFormat<sizeof...(Values)> format, const Values&... values) {
  qxLog(dv_default_log(), format, DVShortened<Values>{values}...);
}

}  // namespace docuvend
