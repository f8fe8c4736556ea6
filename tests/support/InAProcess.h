// Something that is done in a process of its own: whatever is made once in the life of a process is made anew, and whatever ends a process
// ends that one.
#pragma once

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <functional>
#include <stdexcept>
#include <string>

namespace docuvend::tests {

// What the work answers and what it writes to standard error; how its process ended, if not by itself. Called while there is no other
// thread. Work that takes minutes is ended.
inline std::string inAProcess(const std::function<std::string()>& work) {
  static constexpr unsigned kLongestWork = 120;  // seconds
  std::array<int, 2> pipe{};
  if (::pipe(pipe.data()) != 0) throw std::runtime_error("no pipe");
  const pid_t child = ::fork();
  if (child < 0) throw std::runtime_error("no process");
  if (child == 0) {
    ::alarm(kLongestWork);
    ::dup2(pipe[1], STDERR_FILENO);
    // Nothing gets past here: the tests that come next are not for this process.
    const std::string answer = [&work]() noexcept { return work(); }();
    const auto written = ::write(STDERR_FILENO, answer.data(), answer.size());
    ::_exit(written == static_cast<ssize_t>(answer.size()) ? 0 : 1);
  }
  ::close(pipe[1]);
  std::string answer;
  std::array<char, 4096> part{};
  for (ssize_t count = 0; (count = ::read(pipe[0], part.data(), part.size())) != 0;) {
    if (count > 0) answer.append(part.data(), static_cast<std::size_t>(count));
    if (count < 0 && errno != EINTR) throw std::runtime_error("nothing to hear of a process");
  }
  ::close(pipe[0]);
  int status = 0;
  while (::waitpid(child, &status, 0) < 0 && errno == EINTR) continue;
  if (WIFSIGNALED(status)) answer.append(" (ended by signal ").append(std::to_string(WTERMSIG(status))).append(")");
  if (WIFEXITED(status) && WEXITSTATUS(status) != 0) answer.append(" (ended with ").append(std::to_string(WEXITSTATUS(status))).append(")");
  return answer;
}

}  // namespace docuvend::tests
