// execute PROGRAM                   becomes that program, which does the words that follow
// execute-with LIBRARY PROGRAM      the same, with the library loaded into it
// map-over PROGRAM                  has the kernel name that program as the one that this process runs
// orphan                            what follows is done by a grandchild in a session of its own, whose parent is gone
// undumpable                        nobody of this user may look into this process any more
// enter                             goes into new user and mount namespaces
// describe FILE                     mounts the file over the description of this process's confinement
// chroot DIRECTORY
// put PATH TEXT                     writes a file
// processes                         the programs of all processes that can be seen, by name
// connect SERVICE                   sets a connection to the daemon aside
// connect-and-die SERVICE           the same, made by a child that has ended since
// hand-over SOCKET                  hands the connection that was set aside to who listens there, and waits until he is done with it
// take-over SOCKET                  takes a connection from him and sets it aside
#include <fcntl.h>
#include <sched.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <set>
#include <sstream>
#include <utility>

#include "platform/linux/base/confinement.h"
#include "platform/linux/wire/ConnectToSocket.h"
#include "tests/attacks/attacker/Requests.h"
#include "tests/attacks/handing.h"
#include "tests/attacks/namespaces.h"

namespace docuvend::attacker {
namespace {

namespace fs = std::filesystem;
using linux_platform::UniqueDescriptor;

std::string execute(const std::string& program, Words& words) {
  std::vector<std::string> remaining = {program};
  while (!words.isAtEnd()) remaining.push_back(words.next());
  std::vector<char*> pointers;
  for (std::string& word : remaining) pointers.push_back(word.data());
  pointers.push_back(nullptr);
  return outcome(::execv(program.c_str(), pointers.data()));
}

std::string executeWith(Words& words) {
  ::setenv("LD_PRELOAD", words.next().c_str(), /*replace=*/1);
  // In a build with sanitizers, whose runtime wants to be the first library.
  ::setenv("ASAN_OPTIONS", "verify_asan_link_order=0", /*replace=*/1);
  const std::string program = words.next();
  return execute(program, words);
}

// The kernel's own account of this process's memory, so that nothing is wrong with the request but who makes it.
prctl_mm_map ownMemory() {
  constexpr int kStartCode = 26;  // fields of the account, counted from 1
  constexpr int kStartData = 45;
  std::ifstream file("/proc/self/stat");
  const std::string text{std::istreambuf_iterator<char>(file), {}};
  std::istringstream rest(text.substr(text.rfind(')') + 2));
  std::vector<std::uint64_t> fields(3, 0);
  std::string state;
  rest >> state;
  for (std::string value; rest >> value;) fields.push_back(std::strtoull(value.c_str(), nullptr, 10));
  prctl_mm_map map{};
  map.start_code = fields.at(kStartCode - 1);
  map.end_code = fields.at(kStartCode);
  map.start_stack = fields.at(kStartCode + 1);
  map.start_data = fields.at(kStartData - 1);
  map.end_data = fields.at(kStartData);
  map.start_brk = fields.at(kStartData + 1);
  map.brk = reinterpret_cast<std::uintptr_t>(::sbrk(0));
  map.arg_start = fields.at(kStartData + 2);
  map.arg_end = fields.at(kStartData + 3);
  map.env_start = fields.at(kStartData + 4);
  map.env_end = fields.at(kStartData + 5);
  return map;
}

std::string mapOver(const std::string& program) {
  const UniqueDescriptor file(::open(program.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) return outcome(-1);
  prctl_mm_map map = ownMemory();
  map.exe_fd = static_cast<std::uint32_t>(file.get());
  return outcome(::prctl(PR_SET_MM, PR_SET_MM_MAP, &map, sizeof(map), 0));
}

// Waits until nobody has the other end of the pipe.
void awaitEnd(int pipe) {
  char byte = 0;
  while (::read(pipe, &byte, sizeof(byte)) < 0 && errno == EINTR) {
  }
}

std::string becomeOrphan() {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) return outcome(-1);
  const pid_t child = ::fork();
  if (child < 0) return outcome(-1);
  if (child > 0) {
    ::close(ends[1]);
    ::waitpid(child, nullptr, 0);
    awaitEnd(ends[0]);
    ::_exit(0);
  }
  const UniqueDescriptor parent(tests::openSelf());
  const pid_t grandchild = ::fork();
  if (grandchild != 0) ::_exit(grandchild < 0 ? 1 : 0);
  tests::awaitProcess(parent);
  return outcome(::setsid());
}

std::string put(Words& words) {
  const std::string path = words.next();
  const std::string text = words.next();
  const UniqueDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
  return outcome(file ? ::write(file.get(), text.data(), text.size()) : -1);
}

std::string processes() {
  std::set<std::string> names;
  for (const auto& entry : fs::directory_iterator("/proc")) {
    if (!std::isdigit(static_cast<unsigned char>(entry.path().filename().native().front()))) continue;
    std::string name;
    std::getline(std::ifstream(entry.path() / "cmdline"), name, '\0');
    names.insert(name.substr(name.rfind('/') + 1));
  }
  std::string result;
  for (const auto& name : names) result += (result.empty() ? "" : " ") + name;
  return result;
}

UniqueDescriptor connected(const std::string& path) {
  auto socket = linux_platform::connectToSocket(path);
  if (const auto* error = std::get_if<QXError>(&socket)) {
    errno = static_cast<int>(error->code);
    return {};
  }
  return std::get<UniqueDescriptor>(std::move(socket));
}

}  // namespace

UniqueDescriptor connectionOfTheDead(const std::string& service) {
  // Its descriptors are this process's.
  const auto child = static_cast<pid_t>(::syscall(SYS_clone, CLONE_FILES | SIGCHLD, nullptr, nullptr, nullptr, nullptr));
  if (child == 0) ::_exit(connected(publicSocket(service)).release());
  int status = 0;
  constexpr int kNone = 255;
  if (::waitpid(child, &status, 0) != child || !WIFEXITED(status) || WEXITSTATUS(status) == kNone) return {};
  return UniqueDescriptor(WEXITSTATUS(status));
}

namespace {

std::string connectAndDie(const std::string& service) {
  auto connection = connectionOfTheDead(service);
  if (!connection) return "the child has no connection";
  setAside(std::move(connection));
  return "ok";
}

std::string handOver(const std::string& path) {
  const UniqueDescriptor socket = connected(path);
  const UniqueDescriptor connection = takeSetAside();
  if (!socket || !tests::handOver(socket.get(), connection.get())) return outcome(-1);
  awaitEnd(socket.get());
  return "ok";
}

std::string takeOver(const std::string& path) {
  const UniqueDescriptor socket = connected(path);
  if (!socket) return outcome(-1);
  setAside(tests::takeOver(socket.get()));
  return "ok";
}

}  // namespace

Acts identityActs() {
  return {
      {"execute",
       [](Words& words) {
         const std::string program = words.next();
         return execute(program, words);
       }},
      {"execute-with", executeWith},
      {"map-over", [](Words& words) { return mapOver(words.next()); }},
      {"orphan", [](Words&) { return becomeOrphan(); }},
      {"undumpable", [](Words&) { return outcome(::prctl(PR_SET_DUMPABLE, 0, 0, 0, 0)); }},
      {"enter", [](Words&) { return outcome(tests::enterNamespaces(CLONE_NEWUSER | CLONE_NEWNS) ? 0 : -1); }},
      {"describe",
       [](Words& words) { return outcome(::mount(words.next().c_str(), linux_platform::kDescriptionPath, nullptr, MS_BIND, nullptr)); }},
      {"chroot", [](Words& words) { return outcome(::chroot(words.next().c_str())); }},
      {"put", put},
      {"processes", [](Words&) { return processes(); }},
      {"connect",
       [](Words& words) {
         auto connection = connected(publicSocket(words.next()));
         const std::string result = outcome(connection ? 0 : -1);
         setAside(std::move(connection));
         return result;
       }},
      {"connect-and-die", [](Words& words) { return connectAndDie(words.next()); }},
      {"hand-over", [](Words& words) { return handOver(words.next()); }},
      {"take-over", [](Words& words) { return takeOver(words.next()); }},
  };
}

}  // namespace docuvend::attacker
