// A service that has a name: where its socket is, and whom it is for.
#pragma once

#include <map>
#include <optional>
#include <string>
#include <vector>

namespace docuvend::linux_platform {

enum class Audience {
  everyone,         // also peers without an identity, who may ask for little
  unconfinedPeers,  // processes of this user outside every confinement, whether or not they act for a bundle
};

struct NamedService {
  std::string socketPath;  // absolute, in a directory that is there
  Audience audience = Audience::everyone;
  std::optional<std::string> straightBelow = {};      // a request's URL that leads into this directory is made straight (StraightURLs.h)
  std::vector<std::string> operationsForNobody = {};  // all that a peer without an identity may ask for
  std::vector<std::string> releasing = {};            // operations that take nothing of a peer's limits (CallRules.h)
};

// By name.
using NamedServices = std::map<std::string, NamedService>;

}  // namespace docuvend::linux_platform
