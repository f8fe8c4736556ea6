// A service that has a name: where its socket is, and whom it is for.
#pragma once

#include <map>
#include <string>

namespace docuvend::linux_platform {

enum class Audience {
  everyone,         // also peers without an identity: what they may do is decided request by request
  unconfinedPeers,  // processes of this user outside every confinement, whether or not they act for a bundle
};

struct NamedService {
  std::string socketPath;  // absolute, in a directory that is there
  Audience audience = Audience::everyone;
};

// By name.
using NamedServices = std::map<std::string, NamedService>;

}  // namespace docuvend::linux_platform
