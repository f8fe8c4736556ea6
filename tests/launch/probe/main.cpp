// Tries things and says how each ended: one line "what: outcome" for each pair of arguments "what subject". An outcome is "ok" or the name
// of an error, or what was asked for. Only words on standard output; the last word may end the process.
#include <dirent.h>
#include <fcntl.h>
#include <mqueue.h>
#include <sched.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/ipc.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/shm.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "tests/launch/probe/SystemCalls.h"

extern char** environ;

namespace {

constexpr int kExtensionSocket = 3;

std::string outcome(long result) { return result >= 0 ? "ok" : ::strerrorname_np(errno); }

std::string join(const std::vector<std::string>& words) {
  std::string result;
  for (const auto& word : words) result += (result.empty() ? "" : " ") + word;
  return result;
}

std::string openAndClose(const std::string& path, int flags) {
  const int file = ::open(path.c_str(), flags | O_CLOEXEC, 0600);
  std::string result = outcome(file);
  if (file >= 0) ::close(file);
  return result;
}

std::vector<int> numbersIn(const std::string& directory) {
  std::vector<int> numbers;
  DIR* stream = ::opendir(directory.c_str());
  if (stream == nullptr) return numbers;
  while (const dirent* entry = ::readdir(stream)) {
    if (entry->d_name[0] >= '0' && entry->d_name[0] <= '9' && std::atoi(entry->d_name) != ::dirfd(stream)) {
      numbers.push_back(std::atoi(entry->d_name));
    }
  }
  ::closedir(stream);
  std::sort(numbers.begin(), numbers.end());
  return numbers;
}

// Descriptors or processes.
std::string listNumbers(const std::string& directory) {
  std::vector<std::string> words;
  for (const int number : numbersIn(directory)) words.push_back(std::to_string(number));
  return join(words);
}

std::string listNames(const std::string& directory) {
  std::vector<std::string> names;
  DIR* stream = ::opendir(directory.c_str());
  if (stream == nullptr) return outcome(-1);
  while (const dirent* entry = ::readdir(stream)) {
    const std::string name = entry->d_name;
    if (name != "." && name != "..") names.push_back(name);
  }
  ::closedir(stream);
  std::sort(names.begin(), names.end());
  return join(names);
}

std::string connectTo(const std::string& path, bool isAbstract, int& socket) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::copy_n(path.begin(), std::min(path.size(), sizeof(address.sun_path) - 2), address.sun_path + (isAbstract ? 1 : 0));
  const auto size = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size() + 1);
  socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  return outcome(::connect(socket, reinterpret_cast<const sockaddr*>(&address), size));
}

// Stays connected until the other side closes.
std::string stayConnected(const std::string& path) {
  int socket = -1;
  std::string result = connectTo(path, /*isAbstract=*/false, socket);
  char byte = 0;
  while (result == "ok" && ::read(socket, &byte, 1) > 0) {
  }
  return result;
}

// As a grandchild whose parent is gone.
std::string stayConnectedAsOrphan(const std::string& path) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) return outcome(-1);
  const pid_t child = ::fork();
  if (child == 0) {
    if (::fork() != 0) ::_exit(0);
    ::setsid();
    const std::string result = stayConnected(path);
    ::_exit(::write(ends[1], result.data(), result.size()) < 0 ? 1 : 0);
  }
  ::close(ends[1]);
  ::waitpid(child, nullptr, 0);
  char text[64];
  const ssize_t count = ::read(ends[0], text, sizeof(text));
  return {text, static_cast<std::size_t>(std::max<ssize_t>(count, 0))};
}

// Goes into new user and mount namespaces below those that it is in.
std::string enterNamespaces() {
  const std::string user = std::to_string(::geteuid());
  const std::string group = std::to_string(::getegid());
  if (::unshare(CLONE_NEWUSER | CLONE_NEWNS) != 0) return outcome(-1);
  for (const auto& [path, text] : std::vector<std::pair<std::string, std::string>>{{"/proc/self/setgroups", "deny"},
                                                                                   {"/proc/self/uid_map", user + " " + user + " 1"},
                                                                                   {"/proc/self/gid_map", group + " " + group + " 1"}}) {
    const int file = ::open(path.c_str(), O_WRONLY | O_CLOEXEC);
    if (::write(file, text.data(), text.size()) < 0) return outcome(-1);
    ::close(file);
  }
  return "ok";
}

// The connection that "join" makes and "stay" keeps until the other side closes.
int joined = -1;

std::string stay() {
  char byte = 0;
  if (::write(joined, &byte, 1) != 1) return outcome(-1);
  while (::read(joined, &byte, 1) > 0) {
  }
  return "ok";
}

std::string echoOnce() {
  char byte = 0;
  if (::read(kExtensionSocket, &byte, 1) != 1) return "nothing";
  return outcome(::write(kExtensionSocket, &byte, 1));
}

std::string limitOf(__rlimit_resource resource) {
  rlimit limit{};
  ::getrlimit(resource, &limit);
  const std::string most = std::to_string(limit.rlim_max);
  return limit.rlim_cur == limit.rlim_max ? most : std::to_string(limit.rlim_cur) + " of " + most;
}

// Starts children until it may not; how many there are then.
std::string forkUntilRefused() {
  constexpr int kMost = 2000;
  int count = 0;
  std::vector<pid_t> children;
  for (pid_t child = 0; count < kMost && (child = ::fork()) >= 0; ++count) {
    if (child == 0) {
      ::pause();
      ::_exit(0);
    }
    children.push_back(child);
  }
  for (const pid_t child : children) ::kill(child, SIGKILL);
  for (const pid_t child : children) ::waitpid(child, nullptr, 0);
  return std::to_string(count);
}

std::string execute(const std::string& path) {
  const pid_t child = ::fork();
  if (child == 0) {
    ::execl(path.c_str(), path.c_str(), nullptr);
    ::_exit(errno);
  }
  int status = 0;
  ::waitpid(child, &status, 0);
  errno = WEXITSTATUS(status);
  return outcome(errno == 0 ? 0 : -1);
}

// The smallest that there is.
std::string makeMessageQueue() {
  const std::string name = "/docuvend-probe-" + std::to_string(::getpid());
  mq_attr size{};
  size.mq_maxmsg = 1;
  size.mq_msgsize = 1;
  std::string result = outcome(::mq_open(name.c_str(), O_CREAT | O_EXCL | O_RDWR | O_CLOEXEC, 0600, &size));
  ::mq_unlink(name.c_str());
  return result;
}

// Gives it back at once.
std::string lockSharedMemory(std::size_t bytes) {
  const int segment = ::shmget(IPC_PRIVATE, bytes, 0600);
  if (segment < 0) return "no segment";
  std::string result = outcome(::shmctl(segment, SHM_LOCK, nullptr));
  ::shmctl(segment, IPC_RMID, nullptr);
  return result;
}

bool isListedKey(const std::string& description) {
  std::ifstream keys("/proc/keys");
  for (std::string line; std::getline(keys, line);) {
    if (line.find(" " + description + ":") != std::string::npos) return true;
  }
  return false;
}

std::string nextLine(int file) {
  std::string line;
  for (char byte = 0; ::read(file, &byte, 1) == 1 && byte != '\n';) line += byte;
  return line;
}

std::string makeRaw() {
  termios modes{};
  if (::tcgetattr(STDIN_FILENO, &modes) != 0) return outcome(-1);
  ::cfmakeraw(&modes);
  modes.c_oflag |= OPOST;
  return outcome(::tcsetattr(STDIN_FILENO, TCSANOW, &modes));
}

std::string sizeOf(int terminal) {
  winsize size{};
  if (::ioctl(terminal, TIOCGWINSZ, &size) != 0) return outcome(-1);
  return std::to_string(size.ws_row) + "x" + std::to_string(size.ws_col);
}

std::string awaitSize(const std::string& size) {
  constexpr int kMostLooks = 6000;
  for (int i = 0; i < kMostLooks; ++i) {
    if (sizeOf(STDIN_FILENO) == size) return "ok";
    ::usleep(10'000);
  }
  return sizeOf(STDIN_FILENO);
}

std::string flood(int lines) {
  for (int i = 1; i <= lines; ++i) std::printf("line %d\n", i);
  return "ok";
}

std::string attempt(const std::string& what, const std::string& subject) {
  int socket = -1;
  if (what == "read") return openAndClose(subject, O_RDONLY);
  if (what == "write") return openAndClose(subject, O_WRONLY);
  if (what == "create") return openAndClose(subject, O_WRONLY | O_CREAT | O_EXCL);
  if (what == "list") return openAndClose(subject, O_RDONLY | O_DIRECTORY);
  if (what == "truncate") return outcome(::truncate(subject.c_str(), 0));
  if (what == "chmod") return outcome(::chmod(subject.c_str(), 0700));
  if (what == "stat") return outcome(::access(subject.c_str(), F_OK));
  if (what == "unlink") return outcome(::unlink(subject.c_str()));
  if (what == "reopen") return openAndClose("/proc/self/fd/" + subject, O_RDWR);
  if (what == "from-standard-input") {
    const int file = ::openat(0, subject.c_str(), O_RDONLY | O_CLOEXEC);
    return outcome(file);
  }
  if (what == "entries") return listNames(subject);
  if (what == "numbers") return listNumbers(subject);
  if (what == "kill") return outcome(::kill(std::atoi(subject.c_str()), 0));
  if (what == "abstract") return connectTo(subject, /*isAbstract=*/true, socket);
  if (what == "connect") return connectTo(subject, /*isAbstract=*/false, socket);
  if (what == "stay-connected") return stayConnected(subject);
  if (what == "stay-connected-as-orphan") return stayConnectedAsOrphan(subject);
  if (what == "join") return connectTo(subject, /*isAbstract=*/false, joined);
  if (what == "stay") return stay();
  if (what == "enter") return enterNamespaces();
  if (what == "bind") return outcome(::mount(subject.c_str(), subject.c_str(), nullptr, MS_BIND | MS_REC, nullptr));
  if (what == "unshare") return outcome(::unshare(subject == "user" ? CLONE_NEWUSER : CLONE_NEWNS));
  if (what == "mount") return outcome(::mount(subject.c_str(), "/.docuvend-info", nullptr, MS_BIND, nullptr));
  if (what == "chroot") return outcome(::chroot(subject.c_str()));
  if (what == "execute") return execute(subject);
  if (what == "key") return isListedKey(subject) ? "listed" : "not listed";
  if (what == "call") return docuvend::probe::call(subject);
  if (what == "limit") {
    const std::map<std::string, __rlimit_resource> resources = {{"processes", RLIMIT_NPROC},       {"memory", RLIMIT_DATA},
                                                                {"open files", RLIMIT_NOFILE},     {"pending signals", RLIMIT_SIGPENDING},
                                                                {"locked memory", RLIMIT_MEMLOCK}, {"message queues", RLIMIT_MSGQUEUE}};
    return limitOf(resources.at(subject));
  }
  if (what == "make-message-queue") return makeMessageQueue();
  if (what == "lock-shared-memory") return lockSharedMemory(std::stoul(subject));
  if (what == "fork") return forkUntilRefused();
  if (what == "echo") return echoOnce();
  if (what == "variable") {
    const char* value = std::getenv(subject.c_str());
    return value == nullptr ? "(absent)" : value;
  }
  if (what == "variables") {
    std::vector<std::string> names;
    for (char** entry = environ; *entry != nullptr; ++entry) names.emplace_back(*entry, std::strcspn(*entry, "="));
    std::sort(names.begin(), names.end());
    return join(names);
  }
  if (what == "where") {
    char path[4096];
    return ::getcwd(path, sizeof(path)) == nullptr ? outcome(-1) : path;
  }
  if (what == "line") return nextLine(std::atoi(subject.c_str()));
  if (what == "settings") return makeRaw();
  if (what == "size") return sizeOf(std::atoi(subject.c_str()));
  if (what == "await-size") return awaitSize(subject);
  if (what == "flood") return flood(std::atoi(subject.c_str()));
  if (what == "exit") std::exit(std::atoi(subject.c_str()));
  if (what == "die") ::raise(std::atoi(subject.c_str()));
  return "unknown";
}

}  // namespace

int main(int count, char** words) {
  ::setvbuf(stdout, nullptr, _IOLBF, 0);
  for (int i = 1; i + 1 < count; i += 2) {
    const std::string result = attempt(words[i], words[i + 1]);
    std::printf("%s %s: %s\n", words[i], words[i + 1], result.c_str());
  }
  return 0;
}
