// What all processes of one user share, wherever they are: keys, and what a file or a socket does to others who have it.
//
//   make-key              a key of its own
//   fill-keys             as many as the user may have; prints how many, and why no more
//   take-key NAME         finds a key of the user's by name, in its own session or in whatever keyring /proc/keys lists; prints what it
//   holds lease PATH            takes a lease on a file, and keeps it linger                makes the close of a connection to itself wait,
//   wherever that happens call-host             makes a socket that leads to the host of a virtual machine ring                  has system
//   calls made by the kernel
#include <fcntl.h>
#include <linux/io_uring.h>
#include <linux/keyctl.h>
#include <linux/vm_sockets.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <fstream>
#include <string>

#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/attacks/attacker/Acts.h"

namespace docuvend::attacker {
namespace {

using linux_platform::UniqueDescriptor;

constexpr int kHexadecimal = 16;

long makeKey(const std::string& name) { return ::syscall(SYS_add_key, "user", name.c_str(), "x", 1, KEY_SPEC_PROCESS_KEYRING); }

std::string fillKeys(Words& /*words*/) {
  constexpr int kMost = 100'000;
  int made = 0;
  while (made < kMost && makeKey("docuvend-attacker-" + std::to_string(made)) >= 0) ++made;
  return std::to_string(made) + " " + outcome(-1);
}

long linkKeyring(long serial) { return ::syscall(SYS_keyctl, KEYCTL_LINK, serial, KEY_SPEC_SESSION_KEYRING); }

std::string takeKey(Words& words) {
  std::ifstream listed("/proc/keys");
  for (std::string line; std::getline(listed, line);) {
    if (line.find(" keyring ") != std::string::npos) static_cast<void>(linkKeyring(std::stol(line, nullptr, kHexadecimal)));
  }
  const long key = ::syscall(SYS_keyctl, KEYCTL_SEARCH, KEY_SPEC_SESSION_KEYRING, "user", words.next().c_str(), 0);
  if (key < 0) return outcome(-1);
  std::array<char, 64> payload{};
  const long size = ::syscall(SYS_keyctl, KEYCTL_READ, key, payload.data(), payload.size());
  return size < 0 ? outcome(-1) : std::string(payload.data(), static_cast<std::size_t>(size));
}

// The file stays open.
std::string lease(Words& words) {
  const int file = ::open(words.next().c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
  return outcome(file < 0 ? -1 : ::fcntl(file, F_SETLEASE, F_WRLCK));
}

std::string makeLinger(Words& /*words*/) {
  constexpr int kSeconds = 600;
  const UniqueDescriptor socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const linger wait{1, kSeconds};
  return outcome(::setsockopt(socket.get(), SOL_SOCKET, SO_LINGER, &wait, sizeof(wait)));
}

std::string callHost(Words& /*words*/) {
  const UniqueDescriptor socket(::socket(AF_VSOCK, SOCK_STREAM | SOCK_CLOEXEC, 0));
  return outcome(socket ? 0 : -1);
}

std::string makeRing(Words& /*words*/) {
  io_uring_params parameters{};
  const UniqueDescriptor ring(static_cast<int>(::syscall(SYS_io_uring_setup, 1, &parameters)));
  return outcome(ring ? 0 : -1);
}

}  // namespace

Acts sharedThingsActs() {
  return {
      {"make-key", [](Words&) { return outcome(makeKey("docuvend-attacker")); }},
      {"fill-keys", fillKeys},
      {"take-key", takeKey},
      {"lease", lease},
      {"linger", makeLinger},
      {"call-host", callHost},
      {"ring", makeRing},
  };
}

}  // namespace docuvend::attacker
