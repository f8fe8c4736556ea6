// To be there before the daemon, with something that looks like its own.
//
//   listen PATH        leaves a socket there, at which nobody listens any more
//   open-to-all PATH   lets every user read it, and enter it
//   move PATH TO       gives a file or a directory another name
//   remove PATH        with all that is in it
//   runtime DIRECTORY  looks for the daemon's sockets there from now on
#include <sys/socket.h>
#include <sys/stat.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <variant>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/SocketAddress.h"
#include "tests/attacks/attacker/Acts.h"

namespace docuvend::attacker {
namespace {

using linux_platform::SocketAddress;
using linux_platform::UniqueDescriptor;

constexpr mode_t kForAll = 0755;

// None with errno.
UniqueDescriptor listenerAt(const std::string& path) {
  const auto address = SocketAddress::forPath(path);
  const auto* known = std::get_if<SocketAddress>(&address);
  UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (known == nullptr || ::bind(socket.get(), known->address(), known->length()) != 0 || ::listen(socket.get(), SOMAXCONN) != 0) return {};
  return socket;
}

std::string removeAll(const std::string& path) {
  std::error_code error;
  std::filesystem::remove_all(path, error);
  return error ? ::strerrorname_np(error.value()) : "ok";
}

}  // namespace

Acts pretenceActs() {
  return {
      {"listen", [](Words& words) { return outcome(listenerAt(words.next()) ? 0 : -1); }},
      {"open-to-all", [](Words& words) { return outcome(::chmod(words.next().c_str(), kForAll)); }},
      {"move",
       [](Words& words) {
         const std::string path = words.next();
         return outcome(::rename(path.c_str(), words.next().c_str()));
       }},
      {"runtime", [](Words& words) { return outcome(::setenv("XDG_RUNTIME_DIR", words.next().c_str(), /*overwrite=*/1)); }},
      {"remove", [](Words& words) { return removeAll(words.next()); }},
  };
}

}  // namespace docuvend::attacker
