// A service that has a name: where its socket is, and whom it is for.
#pragma once

#include <map>
#include <string>
#include <vector>

namespace docuvend::linux_platform {

enum class Audience {
  everyone,         // also peers without an identity, who may ask for little
  unconfinedPeers,  // processes of this user outside every confinement, whether or not they act for a bundle
};

// How its requests name files.
enum class URLNames {
  straight,  // made so (files/StraightURL.h) before the exported object hears of them
  asSent,    // the service looks at the way itself
};

struct NamedService {
  std::string socketPath;  // absolute, in a directory that is there
  Audience audience = Audience::everyone;
  URLNames urls = URLNames::asSent;
  std::vector<std::string> operationsForNobody = {};  // all that a peer without an identity may ask for
};

// By name.
using NamedServices = std::map<std::string, NamedService>;

}  // namespace docuvend::linux_platform
