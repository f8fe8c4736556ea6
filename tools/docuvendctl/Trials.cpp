#include "tools/docuvendctl/Trials.h"

#include <fcntl.h>
#include <linux/sched.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <optional>
#include <system_error>
#include <utility>
#include <variant>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/base/pidfd.h"
#include "platform/linux/launch/ConfinedLaunch.h"
#include "platform/linux/launch/policy/Landlock.h"
#include "platform/linux/launch/policy/SystemCalls.h"
#include "platform/linux/wire/EpollSet.h"

namespace docuvend::ctl {
namespace {

using linux_platform::Bundle;
using linux_platform::UniqueDescriptor;

constexpr std::chrono::seconds kLongestTrial{10};
constexpr const char* kSystemPrograms = "/usr/bin";
constexpr const char* kProgramThatSucceeds = "/usr/bin/true";
// How the process of a trial ends.
constexpr int kWorked = 0;
constexpr int kNotRestricted = 1;
constexpr int kStillOpen = 2;
constexpr int kNotExecuted = 125;

std::string textOf(int error) { return std::system_category().message(error); }

// The status with which a child ended by itself within the time; none when it did not.
std::optional<int> statusOfChild(pid_t child) {
  const UniqueDescriptor process = linux_platform::openPidfd(child);
  pollfd ended{process.get(), POLLIN, 0};
  const auto patience = static_cast<int>(std::chrono::duration_cast<std::chrono::milliseconds>(kLongestTrial).count());
  if (!process || ::poll(&ended, 1, patience) != 1) ::kill(child, SIGKILL);
  int status = 0;
  if (::waitpid(child, &status, 0) != child || !WIFEXITED(status)) return std::nullopt;
  return WEXITSTATUS(status);
}

std::string firstLine(const UniqueDescriptor& file) {
  std::array<char, 512> bytes{};
  const ssize_t count = ::pread(file.get(), bytes.data(), bytes.size(), 0);
  const std::string text(bytes.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
  return text.substr(0, text.find('\n'));
}

// A directory that goes with its contents.
class PassingDirectory {
 public:
  PassingDirectory() : path_((std::filesystem::temp_directory_path() / "docuvend-trial-XXXXXX").string()) {
    isThere_ = ::mkdtemp(path_.data()) != nullptr;
  }
  ~PassingDirectory() {
    std::error_code error;
    if (isThere_) std::filesystem::remove_all(path_, error);
  }
  PassingDirectory(const PassingDirectory&) = delete;
  PassingDirectory& operator=(const PassingDirectory&) = delete;

  [[nodiscard]] bool isThere() const { return isThere_; }
  [[nodiscard]] const std::string& path() const { return path_; }

 private:
  std::string path_;
  bool isThere_ = false;
};

[[noreturn]] void becomeLaunched(linux_platform::LaunchPlan plan, const UniqueDescriptor& output) {
  const UniqueDescriptor nothing(::open("/dev/null", O_RDWR | O_CLOEXEC));
  const bool isSet =
      ::dup2(nothing.get(), STDIN_FILENO) >= 0 && ::dup2(nothing.get(), STDOUT_FILENO) >= 0 && ::dup2(output.get(), STDERR_FILENO) >= 0;
  if (isSet) static_cast<void>(linux_platform::execute(std::move(plan)));
  ::_exit(kNotExecuted);
}

TrialFailure runPlan(linux_platform::LaunchPlan plan) {
  const UniqueDescriptor output(::memfd_create("docuvend-trial", MFD_CLOEXEC));
  const pid_t child = ::fork();
  if (child < 0) return "no process can be started: " + textOf(errno);
  if (child == 0) becomeLaunched(std::move(plan), output);
  const auto status = statusOfChild(child);
  if (status == kWorked) return std::nullopt;
  std::string text = "a confined process could not be started";
  const std::string reason = firstLine(output);
  return reason.empty() ? text : text.append(": ").append(reason);
}

}  // namespace

TrialFailure tryUserNamespace() {
  clone_args wanted{};
  wanted.flags = CLONE_NEWUSER | CLONE_NEWNS;
  wanted.exit_signal = SIGCHLD;
  const auto child = static_cast<pid_t>(::syscall(SYS_clone3, &wanted, sizeof(wanted)));
  if (child == 0) ::_exit(kWorked);
  if (child < 0) return "an ordinary user may not make one: " + textOf(errno);
  if (statusOfChild(child) == kWorked) return std::nullopt;
  return "a process in one of its own did not end well";
}

TrialFailure tryLandlock(int level) {
  const pid_t child = ::fork();
  if (child < 0) return "no process can be started: " + textOf(errno);
  if (child == 0) {
    if (linux_platform::restrictToRules({}, level)) ::_exit(kNotRestricted);
    ::_exit(::open("/", O_RDONLY | O_DIRECTORY | O_CLOEXEC) < 0 && errno == EACCES ? kWorked : kStillOpen);
  }
  const auto status = statusOfChild(child);
  if (status == kWorked) return std::nullopt;
  return status == kStillOpen ? "a restricted process still opens files" : "a process could not be restricted with it";
}

TrialFailure trySystemCalls() {
  const pid_t child = ::fork();
  if (child < 0) return "no process can be started: " + textOf(errno);
  if (child == 0) {
    if (linux_platform::refuseSystemCalls(linux_platform::Leases::refused)) ::_exit(kNotRestricted);
    // A socket is no terminal, which its own answer would be.
    const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    ::_exit(socket >= 0 && ::ioctl(socket, TIOCSTI, "x") != 0 && errno == EPERM ? kWorked : kStillOpen);
  }
  const auto status = statusOfChild(child);
  if (status == kWorked) return std::nullopt;
  return status == kStillOpen ? "a filtered process still makes the calls" : "the kernel does not filter them";
}

TrialFailure tryLaunch() {
  const PassingDirectory container;
  if (!container.isThere()) return "no temporary directory can be made: " + textOf(errno);
  std::array<int, 2> ends{};
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) return "no socket can be made: " + textOf(errno);
  UniqueDescriptor inside(ends[0]);
  const UniqueDescriptor outside(ends[1]);
  Bundle bundle;
  bundle.identifier = "com.orvane.docuvend-trial";
  bundle.directory = kSystemPrograms;
  bundle.executable = kProgramThatSucceeds;
  bundle.container = container.path();
  auto plan = planLaunch(bundle, /*arguments=*/{}, linux_platform::LaunchKind::extension, std::move(inside), linux_platform::Paths{});
  if (const auto* error = std::get_if<QXError>(&plan)) return error->description();
  return runPlan(std::get<linux_platform::LaunchPlan>(std::move(plan)));
}

TrialFailure tryWatch() {
  if (linux_platform::EpollSet::create()) return std::nullopt;
  return "this user's processes have used up fs.epoll.max_user_watches: who connects now is served more slowly";
}

}  // namespace docuvend::ctl
