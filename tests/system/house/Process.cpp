#include "tests/system/house/Process.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>

#include "tests/wire/Waiting.h"

namespace docuvend::tests {
namespace {

using linux_platform::UniqueDescriptor;

constexpr int kStatusOfSignal = 128;

UniqueDescriptor memoryFile(const char* name) {
  UniqueDescriptor file(::memfd_create(name, MFD_CLOEXEC));
  if (!file) throw std::runtime_error("no memory file");
  return file;
}

std::string allOf(const UniqueDescriptor& file) {
  std::string text(static_cast<std::size_t>(::lseek(file.get(), 0, SEEK_END)), '\0');
  const ssize_t count = ::pread(file.get(), text.data(), text.size(), 0);
  text.resize(count < 0 ? 0 : static_cast<std::size_t>(count));
  return text;
}

std::vector<char*> pointers(std::vector<std::string>& texts) {
  std::vector<char*> result;
  result.reserve(texts.size() + 1);
  for (std::string& text : texts) result.push_back(text.data());
  result.push_back(nullptr);
  return result;
}

}  // namespace

Process::Process(const Command& command) : output_(memoryFile("output")), errors_(memoryFile("errors")) {
  const UniqueDescriptor input = memoryFile("input");
  if (::pwrite(input.get(), command.input.data(), command.input.size(), 0) != static_cast<ssize_t>(command.input.size())) {
    throw std::runtime_error("no input for a program");
  }
  posix_spawn_file_actions_t actions;
  ::posix_spawn_file_actions_init(&actions);
  ::posix_spawn_file_actions_adddup2(&actions, input.get(), STDIN_FILENO);
  ::posix_spawn_file_actions_adddup2(&actions, command.output < 0 ? output_.get() : command.output, STDOUT_FILENO);
  ::posix_spawn_file_actions_adddup2(&actions, command.errors < 0 ? errors_.get() : command.errors, STDERR_FILENO);
  auto words = command.words;
  auto environment = command.environment;
  const int error = ::posix_spawn(&pid_, words.front().c_str(), &actions, nullptr, pointers(words).data(), pointers(environment).data());
  ::posix_spawn_file_actions_destroy(&actions);
  if (error != 0) throw std::runtime_error("cannot start " + words.front());
  // Its number is its own until it is waited for.
  pidfd_.reset(static_cast<int>(::syscall(SYS_pidfd_open, pid_, 0)));
  if (!pidfd_) throw std::runtime_error("no descriptor of " + words.front());
}

Process::~Process() {
  if (ending_) return;
  signal(SIGKILL);
  ::waitpid(pid_, nullptr, 0);
}

bool Process::hasEndedWithin(int milliseconds) const {
  pollfd waiting{pidfd_.get(), POLLIN, 0};
  int count = 0;
  do {
    count = ::poll(&waiting, 1, milliseconds);
  } while (count < 0 && errno == EINTR);
  return count > 0;
}

bool Process::isRunning() { return !ending_ && !hasEndedWithin(0); }

void Process::signal(int number) const { ::syscall(SYS_pidfd_send_signal, pidfd_.get(), number, nullptr, 0); }

const Ending& Process::wait() {
  if (ending_) return *ending_;
  if (!hasEndedWithin(static_cast<int>(std::chrono::milliseconds(kPatience).count()))) {
    ADD_FAILURE() << "a program does not end; it said: " << allOf(errors_);
    signal(SIGKILL);
  }
  int status = 0;
  ::waitpid(pid_, &status, 0);
  ending_ = Ending{WIFEXITED(status) ? WEXITSTATUS(status) : kStatusOfSignal + WTERMSIG(status), allOf(output_), allOf(errors_)};
  return *ending_;
}

std::string contentsOf(const std::string& path) {
  const std::ifstream file(path, std::ios::binary);
  std::ostringstream contents;
  contents << file.rdbuf();  // a process's files cannot be read any more when it ends in the middle: then there are none
  return std::move(contents).str();
}

}  // namespace docuvend::tests
