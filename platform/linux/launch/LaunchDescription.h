// The description that lies at the root of a confinement's mount namespace and says who runs there. The launcher writes it; the daemon
// believes it when the kernel vouches for the namespace. Its whole text:
//
//   [Application]
//   name=BUNDLE-IDENTIFIER
//   incarnation=digits and dots
//   instance=32 lower-case hexadecimal digits
//   kind=application|extension
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/launch/ConfinedLaunch.h"

namespace docuvend::linux_platform {

inline constexpr std::size_t kLongestDescription = 512;

struct LaunchDescription {
  std::string bundleIdentifier;
  std::string incarnation;  // of the bundle (Bundle.h), as the launcher found it
  std::string instance;
  LaunchKind kind = LaunchKind::application;
  friend bool operator==(const LaunchDescription&, const LaunchDescription&) = default;
};

[[nodiscard]] std::string descriptionText(const LaunchDescription& description);
// None unless the text is exactly what descriptionText makes.
[[nodiscard]] std::optional<LaunchDescription> parseDescription(std::string_view text);
// 32 hexadecimal digits that nobody can guess; none when the kernel gives no random bytes.
[[nodiscard]] std::optional<std::string> newInstance();

}  // namespace docuvend::linux_platform
