// The errors that the extension host itself makes.
#pragma once

#include <cstdint>
#include <string>
#include <utility>

#include "platform/QXError.h"

namespace docuvend::linux_platform {

inline constexpr const char* kExtensionHostErrorDomain = "QXExtensionHostErrorDomain";

enum class ExtensionHostErrorCode : std::int64_t {
  backingOff = 1,    // its process ended too soon too often; try again later
  notStarted = 2,    // no process could be made; the underlying error says why
  notAnswering = 3,  // its process was ended because an answer took too long
  ended = 4,         // its process ended
  stopped = 5,       // the extension host is going away
  bundleIsGone = 6,  // its bundle was removed or replaced; the one that is installed now, if any, is another extension
};

[[nodiscard]] inline QXError extensionHostError(ExtensionHostErrorCode code, std::string description) {
  return QXError::make(kExtensionHostErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

[[nodiscard]] inline QXError bundleIsGoneError(const std::string& identifier) {
  return extensionHostError(ExtensionHostErrorCode::bundleIsGone, "The bundle of " + identifier + " was removed or replaced.");
}

}  // namespace docuvend::linux_platform
