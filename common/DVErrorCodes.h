// The domain and the codes of the errors that this system makes. Header-only: client libraries include it too.
#pragma once

#include <cstdint>

namespace docuvend {

inline constexpr const char* kDVErrorDomain = "DVErrorDomain";

// The codes stand on the wire: they are never renumbered.
enum class DVErrorCode : std::int64_t {
  clientLacksEntitlement = 1,
  notPermitted = 2,
  invalidBookmarkableString = 3,
  invalidParameter = 4,
  notFound = 5,
  notFoundURL = 6,
  pluginOperationFailed = 7,
  proxyNotFound = 8,
  sandboxExtensionFailed = 9,
};

}  // namespace docuvend
