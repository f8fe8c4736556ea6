// The errors of installing and removing bundles.
#pragma once

#include <cstdint>
#include <string>
#include <utility>

#include "platform/QXError.h"

namespace docuvend::linux_platform {

inline constexpr const char* kBundleErrorDomain = "QXBundleErrorDomain";

enum class BundleErrorCode : std::int64_t {
  noBundle = 1,      // the directory is none, or not a sound one
  forbidden = 2,     // it holds something that no bundle may hold
  tooLarge = 3,      // more, deeper or larger than is taken
  notPermitted = 4,  // the system's directory has a bundle of that identifier
  notFound = 5,      // no bundle of that identifier is installed
  inTheWay = 6,      // something else lies where the bundle is to be put
  notItsOwn = 7,     // it claims a group that is not its own, or to say who its members are
};

[[nodiscard]] inline QXError bundleError(BundleErrorCode code, std::string description) {
  return QXError::make(kBundleErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

}  // namespace docuvend::linux_platform
