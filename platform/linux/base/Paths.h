// Where everything lies on this machine for this user.
#pragma once

#include <optional>
#include <string>
#include <variant>

#include "platform/QXError.h"

namespace docuvend::linux_platform {

struct Paths {
  std::string home;             // $HOME, absolute
  std::string systemBundles;    // "/usr/share/docuvend/bundles"
  std::string userBundles;      // home + "/.local/share/docuvend/bundles"
  std::string containers;       // home + "/.local/share/docuvend/containers"; one directory per bundle identifier
  std::string groupContainers;  // home + "/.local/share/docuvend/groups"; one directory per group
  std::string runtime;          // $XDG_RUNTIME_DIR + "/docuvend", mode 700
  std::string publicSockets;    // runtime + "/public": what confined processes see of it
  std::string lockState;        // runtime + "/lock-state"
  std::string tokenKey;         // runtime + "/token-key"
  std::string tokenFloors;      // runtime + "/token-floors"

  // An error that says so when HOME or XDG_RUNTIME_DIR is missing or relative, or when the run-time directory is not this user's own
  // with mode 700. Creates nothing.
  [[nodiscard]] static std::variant<Paths, QXError> fromEnvironment();
};

// Makes `runtime` and `publicSockets` (mode 700), or says why not: a directory of another user, of another mode, or a link is refused.
[[nodiscard]] std::optional<QXError> prepareRuntimeDirectories(const Paths& paths);

}  // namespace docuvend::linux_platform
