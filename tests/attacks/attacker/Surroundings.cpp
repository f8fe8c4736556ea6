// What lies around a confinement: sockets, processes, the terminal, and what whoever started it left open or set.
//
//   reach PATH              connects to a stream socket
//   reach-abstract NAME     the same, of the name without a path
//   own-abstract            listens under such a name of its own, and connects to it
//   open-device PATH        for reading and writing
//
//   signal PROCESS          may it send one?          PROCESS is a number, or "child" for a child of its own
//   signal-all              kills all that it may
//   trace PROCESS           takes it under its control
//   read-memory PROCESS
//   take-descriptor PROCESS its standard input
//
//   type TEXT               as if somebody had typed it at the terminal that is its standard input
//   take-terminal           makes that terminal the controlling one of a session of its own
//   upset-terminal          takes echo, lines and the signals' characters from it
//   overhear NAME           makes the file NAME.holding, and reads that terminal until NAME.go is there; what it has read so far is in
//   NAME.heard terminal                has its session one? What the console's own controls ask before they insert its selection
//
//   descriptors             the numbers that are open
//   variables               the names in its environment
//   status FIELD            of its own process
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <cstddef>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>
#include <utility>

#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/attacks/attacker/Acts.h"
#include "tests/wire/Waiting.h"

extern char** environ;

namespace docuvend::attacker {
namespace {

using linux_platform::UniqueDescriptor;

enum class Name { path, abstract };

struct Address {
  sockaddr_un address{};
  socklen_t size = 0;
};

Address addressOf(const std::string& name, Name kind) {
  Address result;
  result.address.sun_family = AF_UNIX;
  const std::size_t offset = kind == Name::abstract ? 1 : 0;
  const std::size_t length = std::min(name.size(), sizeof(result.address.sun_path) - 2);
  std::copy_n(name.begin(), length, result.address.sun_path + offset);
  result.size = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + length + 1);
  return result;
}

UniqueDescriptor streamSocket() { return UniqueDescriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)); }

std::string connectTo(const std::string& name, Name kind) {
  const Address to = addressOf(name, kind);
  const UniqueDescriptor socket = streamSocket();
  return outcome(::connect(socket.get(), reinterpret_cast<const sockaddr*>(&to.address), to.size));
}

std::string connectToOwnAbstract() {
  const std::string name = "docuvend-attacker-" + std::to_string(::getpid());
  const Address at = addressOf(name, Name::abstract);
  const UniqueDescriptor listener = streamSocket();
  if (::bind(listener.get(), reinterpret_cast<const sockaddr*>(&at.address), at.size) != 0 || ::listen(listener.get(), 1) != 0) {
    return outcome(-1);
  }
  return connectTo(name, Name::abstract);
}

// The process that a word names; a child that was made for it ends with the object.
class Target {
 public:
  explicit Target(const std::string& word) {
    if (word != "child") {
      std::from_chars(word.data(), word.data() + word.size(), number_);
      return;
    }
    child_ = number_ = ::fork();
    while (child_ == 0) ::pause();
  }
  ~Target() {
    if (child_ <= 0) return;
    ::kill(child_, SIGKILL);
    ::waitpid(child_, nullptr, 0);
  }
  Target(const Target&) = delete;
  Target& operator=(const Target&) = delete;

  [[nodiscard]] pid_t number() const { return number_; }

 private:
  pid_t number_ = -1;
  pid_t child_ = -1;
};

std::string signalProcess(Words& words) { return outcome(::kill(Target(words.next()).number(), 0)); }

std::string trace(Words& words) {
  const Target target(words.next());
  return outcome(::ptrace(PTRACE_SEIZE, target.number(), nullptr, nullptr));
}

std::string readMemory(Words& words) {
  static char theirs = 'x';  // at the same address in a child
  char mine = 0;
  const Target target(words.next());
  const iovec to{&mine, 1};
  const iovec from{&theirs, 1};
  return outcome(::process_vm_readv(target.number(), &to, 1, &from, 1, 0));
}

std::string takeDescriptor(Words& words) {
  const Target target(words.next());
  const UniqueDescriptor process(static_cast<int>(::syscall(SYS_pidfd_open, target.number(), 0)));
  if (!process) return outcome(-1);
  const UniqueDescriptor taken(static_cast<int>(::syscall(SYS_pidfd_getfd, process.get(), STDIN_FILENO, 0)));
  return outcome(taken ? 0 : -1);
}

std::string type(Words& words) {
  for (char c : words.next()) {
    if (::ioctl(STDIN_FILENO, TIOCSTI, &c) != 0) return outcome(-1);
  }
  return "ok";
}

// In a child, which can begin a session for certain.
std::string takeTerminal(Words& /*words*/) {
  const pid_t child = ::fork();
  if (child == 0) {
    ::setsid();
    ::_exit(::ioctl(STDIN_FILENO, TIOCSCTTY, 1) == 0 ? 0 : errno);
  }
  int status = 0;
  ::waitpid(child, &status, 0);
  errno = WEXITSTATUS(status);
  return outcome(errno == 0 ? 0 : -1);
}

std::string upsetTerminal(Words& /*words*/) {
  termios modes{};
  if (::tcgetattr(STDIN_FILENO, &modes) != 0) return outcome(-1);
  modes.c_lflag &= ~static_cast<tcflag_t>(ECHO | ICANON | ISIG);
  return outcome(::tcsetattr(STDIN_FILENO, TCSANOW, &modes));
}

std::string overhear(Words& words) {
  constexpr int kBetweenLooks = 10;
  const std::string name = words.next();
  std::ofstream heard(name + ".heard");
  std::ofstream(name + ".holding").close();
  const auto deadline = std::chrono::steady_clock::now() + tests::kPatience;
  while (!std::filesystem::exists(name + ".go")) {
    if (std::chrono::steady_clock::now() > deadline) return "nobody came";
    pollfd waiting{STDIN_FILENO, POLLIN, 0};
    if (::poll(&waiting, 1, kBetweenLooks) != 1) continue;
    char bytes[256];
    const ssize_t count = ::read(STDIN_FILENO, bytes, sizeof(bytes));
    if (count <= 0) return outcome(count);
    heard.write(bytes, count).flush();
  }
  return "ok";
}

// The number of the controlling terminal, the fifth field after the program's name, is 0 without one.
bool hasTerminal() {
  std::string stat;
  std::getline(std::ifstream("/proc/self/stat"), stat);
  char state = 0;
  int parent = 0;
  int group = 0;
  int session = 0;
  int terminal = 0;
  std::istringstream(stat.substr(stat.rfind(')') + 1)) >> state >> parent >> group >> session >> terminal;
  return terminal != 0;
}

std::string joined(const auto& words) {
  std::string result;
  for (const std::string& word : words) result += (result.empty() ? "" : " ") + word;
  return result;
}

std::string descriptors(Words& /*words*/) {
  // The directory's own descriptor is gone when the names are looked up.
  std::set<std::string> numbers;
  for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) numbers.insert(entry.path().filename());
  std::erase_if(numbers, [](const std::string& number) { return ::fcntl(std::stoi(number), F_GETFD) < 0; });
  return joined(numbers);
}

std::string variables(Words& /*words*/) {
  std::set<std::string> names;
  for (char** entry = environ; *entry != nullptr; ++entry) names.emplace(*entry, std::strcspn(*entry, "="));
  return joined(names);
}

std::string status(Words& words) {
  const std::string field = words.next() + ":\t";
  std::ifstream lines("/proc/self/status");
  for (std::string line; std::getline(lines, line);) {
    if (line.starts_with(field)) return line.substr(field.size());
  }
  return "(absent)";
}

}  // namespace

Acts surroundingsActs() {
  return {
      {"reach", [](Words& words) { return connectTo(words.next(), Name::path); }},
      {"reach-abstract", [](Words& words) { return connectTo(words.next(), Name::abstract); }},
      {"own-abstract", [](Words&) { return connectToOwnAbstract(); }},
      {"open-device",
       [](Words& words) {
         const UniqueDescriptor file(::open(words.next().c_str(), O_RDWR | O_NOCTTY | O_NONBLOCK | O_CLOEXEC));
         return outcome(file ? 0 : -1);
       }},
      {"signal", signalProcess},
      {"signal-all", [](Words&) { return outcome(::kill(-1, SIGKILL)); }},
      {"trace", trace},
      {"read-memory", readMemory},
      {"take-descriptor", takeDescriptor},
      {"type", type},
      {"terminal", [](Words&) { return hasTerminal() ? "there" : "none"; }},
      {"take-terminal", takeTerminal},
      {"upset-terminal", upsetTerminal},
      {"overhear", overhear},
      {"descriptors", descriptors},
      {"variables", variables},
      {"status", status},
  };
}

}  // namespace docuvend::attacker
