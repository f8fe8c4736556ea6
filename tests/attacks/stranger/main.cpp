// Does, as another user, what the tests ask for: stranger SOCKET PROGRAM. Who connects to the socket sends a line of words with tabs
// between them, the run-time directory first; the program is run with the others, and what it prints is the answer.
//
// It is started beside a run of the tests and lives until it is told to end; what it started goes with it.
#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <string>
#include <variant>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/SocketAddress.h"

namespace docuvend {
namespace {

using linux_platform::SocketAddress;
using linux_platform::UniqueDescriptor;

constexpr std::size_t kLongestLine = 65536;
// A test that ended without a word is not waited for.
constexpr unsigned kMostSeconds = 300;
constexpr mode_t kForAll = 0777;

// Who may come to the directory in which it lies may come in.
UniqueDescriptor listenAt(const std::string& path) {
  const auto address = SocketAddress::forPath(path);
  const auto* known = std::get_if<SocketAddress>(&address);
  UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (known == nullptr || ::bind(socket.get(), known->address(), known->length()) != 0 || ::chmod(path.c_str(), kForAll) != 0 ||
      ::listen(socket.get(), SOMAXCONN) != 0) {
    return {};
  }
  return socket;
}

std::vector<std::string> wordsFrom(int connection) {
  std::vector<std::string> words(1);
  char byte = 0;
  for (std::size_t count = 0; count < kLongestLine && ::read(connection, &byte, sizeof(byte)) == sizeof(byte); ++count) {
    if (byte == '\n') return words;
    if (byte == '\t') {
      words.emplace_back();
    } else {
      words.back() += byte;
    }
  }
  return {};
}

// In a process of its own.
[[noreturn]] void serve(const UniqueDescriptor& connection, const char* program, pid_t parent) {
  ::prctl(PR_SET_PDEATHSIG, SIGKILL, 0, 0, 0);
  if (::getppid() != parent) ::_exit(1);
  ::alarm(kMostSeconds);
  ::signal(SIGCHLD, SIG_DFL);
  std::vector<std::string> words = wordsFrom(connection.get());
  if (words.empty()) ::_exit(1);
  std::string runtime = "XDG_RUNTIME_DIR=" + words.front();
  words.front() = program;
  std::vector<char*> arguments;
  for (std::string& word : words) arguments.push_back(word.data());
  arguments.push_back(nullptr);
  std::vector<char*> environment = {runtime.data(), nullptr};
  ::dup2(connection.get(), STDOUT_FILENO);
  ::dup2(connection.get(), STDERR_FILENO);
  ::execve(program, arguments.data(), environment.data());
  ::_exit(1);
}

}  // namespace
}  // namespace docuvend

int main(int count, char** arguments) {
  using namespace docuvend;
  if (count != 3 || ::geteuid() == 0) {
    std::fputs("usage, not as root: docuvend-stranger-agent SOCKET PROGRAM\n", stderr);
    return 2;
  }
  ::signal(SIGCHLD, SIG_IGN);  // nobody waits for them
  const UniqueDescriptor listener = listenAt(arguments[1]);
  if (!listener) {
    std::perror(arguments[1]);
    return 1;
  }
  const pid_t self = ::getpid();
  for (;;) {
    const UniqueDescriptor connection(::accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!connection) {
      if (errno == EINTR || errno == ECONNABORTED) continue;
      std::perror("nobody else is heard");
      return 1;
    }
    if (::fork() == 0) serve(connection, arguments[2], self);
  }
}
