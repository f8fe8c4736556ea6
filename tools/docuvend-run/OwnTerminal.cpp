// An application with the user's terminal open could read what is typed into the shell while it is stopped or in the background: it is a
// session of its own, and job control is for the terminal's session. docuvend-run is in that session, and reads for it.
//
// Invariants:
// - The user's terminal is read only while this process's group is in front. Where that changes between the look and the read, the kernel
//   refuses the read (SIGTTIN is blocked); and what came with a signal's character (^Z, ^C) is dropped, for it may have been typed after
//   it, to the shell. From one that ends the application on nothing is read.
// - Characters that send signals keep doing so at the user's terminal, whatever the application sets at its own: it can always be
// interrupted
//   and stopped.
// - Each direction holds one piece, and takes another when that is gone. Nothing waits but poll.
// - Once the child is reaped nothing is written any more: its processes are one namespace's, which ended with it. A read that finds nothing
//   has found all.
#include "tools/docuvend-run/OwnTerminal.h"

#include <fcntl.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/signalfd.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <utility>

#include "tools/docuvend-run/Complaint.h"

namespace docuvend {
namespace {

using linux_platform::LaunchPlan;
using linux_platform::UniqueDescriptor;

constexpr std::size_t kPiece = 4096;
constexpr int kLookForFront = 200;  // milliseconds: nobody tells a process in the background that it is in front now
constexpr int kCannotLaunch = 125;
// What ends bubblewrap, and the application with it, unless whoever started docuvend-run has it ignored.
constexpr std::array kPassed = {SIGHUP, SIGINT, SIGQUIT, SIGTERM, SIGUSR1, SIGUSR2, SIGALRM};

constexpr std::array kTyped = {SIGINT, SIGQUIT, SIGTSTP};

// What the kernel sends when the process that started this one has ended; nobody else has a meaning for it.
int starterEnded() { return SIGRTMIN; }

QXError failure(const std::string& what) { return QXError::system(errno, what); }

bool isIgnored(int number) {
  struct sigaction action {};
  return ::sigaction(number, nullptr, &action) == 0 && action.sa_handler == SIG_IGN;
}

sigset_t setOf(int number) {
  sigset_t set;
  ::sigemptyset(&set);
  ::sigaddset(&set, number);
  return set;
}

// One that is typed, of which this process has not been told yet.
bool isInterrupted() {
  sigset_t pending;
  ::sigpending(&pending);
  return std::any_of(kTyped.begin(), kTyped.end(), [&pending](int number) { return ::sigismember(&pending, number) == 1; });
}

// Nothing was there, but something may come.
bool isEmptyForNow() { return errno == EAGAIN || errno == EINTR; }

std::string piece(int descriptor, ssize_t& count) {
  std::string bytes(kPiece, '\0');
  count = ::read(descriptor, bytes.data(), bytes.size());
  bytes.resize(count > 0 ? static_cast<std::size_t>(count) : 0);
  return bytes;
}

}  // namespace

std::variant<int, QXError> OwnTerminal::run(LaunchPlan plan) {
  if (auto error = open()) return *std::move(error);
  if (auto error = watchSignals()) return *std::move(error);
  const pid_t self = ::getpid();
  child_ = ::fork();
  if (child_ < 0) return failure("cannot start a process");
  if (child_ == 0) becomeApplication(std::move(plan), self);
  theirs_.reset();
  plan = {};

  relay();
  user_.leaveRawMode();
  if (WIFEXITED(*ended_)) return WEXITSTATUS(*ended_);
  const int number = WTERMSIG(*ended_);
  ::signal(number, SIG_DFL);
  const sigset_t one = setOf(number);
  ::raise(number);
  ::sigprocmask(SIG_UNBLOCK, &one, nullptr);
  return 128 + number;
}

std::optional<QXError> OwnTerminal::open() {
  own_.reset(::posix_openpt(O_RDWR | O_NOCTTY | O_NONBLOCK | O_CLOEXEC));
  if (!own_ || ::unlockpt(own_.get()) != 0) return failure("cannot make a terminal for the application");
  theirs_.reset(::ioctl(own_.get(), TIOCGPTPEER, O_RDWR | O_NOCTTY | O_CLOEXEC));
  if (!theirs_) return failure("cannot open the application's terminal");
  const auto modes = user_.modesForApplication();
  if (modes && ::tcsetattr(theirs_.get(), TCSANOW, &*modes) != 0) return failure("cannot set the application's terminal");
  giveSize();
  return std::nullopt;
}

std::optional<QXError> OwnTerminal::watchSignals() {
  for (const int number : {SIGCHLD, SIGCONT, SIGWINCH, starterEnded()}) ::signal(number, SIG_DFL);
  sigset_t watched = setOf(SIGCHLD);
  for (const int number : {SIGCONT, SIGWINCH, starterEnded()}) ::sigaddset(&watched, number);
  if (!isIgnored(SIGTSTP)) ::sigaddset(&watched, SIGTSTP);
  for (const int number : kPassed) {
    if (!isIgnored(number)) ::sigaddset(&watched, number);
  }
  sigset_t blocked = watched;
  for (const int number : {SIGTTIN, SIGTTOU}) ::sigaddset(&blocked, number);
  ::sigprocmask(SIG_BLOCK, &blocked, &maskBefore_);
  signals_.reset(::signalfd(-1, &watched, SFD_CLOEXEC | SFD_NONBLOCK));
  if (!signals_) return failure("cannot wait for signals");
  const pid_t starter = ::getppid();
  if (::prctl(PR_SET_PDEATHSIG, starterEnded()) != 0) return failure("cannot watch the process that started this one");
  if (::getppid() != starter) ::raise(starterEnded());
  return std::nullopt;
}

// Bubblewrap asks to end with its parent too, but some milliseconds later.
void OwnTerminal::becomeApplication(LaunchPlan plan, pid_t parent) const {
  ::sigprocmask(SIG_SETMASK, &maskBefore_, nullptr);
  bool isReady = ::prctl(PR_SET_PDEATHSIG, SIGKILL) == 0 && ::getppid() == parent;
  for (const int number : user_.replaced()) isReady = isReady && ::dup2(theirs_.get(), number) == number;
  if (isReady) complain(execute(std::move(plan)).description());
  ::_exit(kCannotLaunch);
}

void OwnTerminal::relay() {
  while (!isFinished()) await();
}

void OwnTerminal::await() {
  const bool isInFront = own_ && !isEnding_ && user_.isInFront();
  if (isInFront && !wasInFront_) user_.enterRawMode();
  wasInFront_ = isInFront;
  const auto when = [](bool isWanted, int descriptor, short events) { return pollfd{isWanted ? descriptor : -1, events, 0}; };
  std::array<pollfd, 5> waits = {when(true, signals_.get(), POLLIN), when(isInFront && input_.empty(), user_.input(), POLLIN),
                                 when(own_ && !input_.empty(), own_.get(), POLLOUT), when(own_ && output_.empty(), own_.get(), POLLIN),
                                 when(!output_.empty(), user_.output(), POLLOUT)};
  int patience = own_ && user_.input() >= 0 && !isInFront && !isEnding_ ? kLookForFront : -1;
  if (ended_ && (output_.empty() || isEnding_)) patience = 0;
  if (::poll(waits.data(), waits.size(), patience) < 0) return;

  // A stop comes before what was typed after it.
  if (waits[0].revents != 0) return takeSignals();
  if (waits[1].revents != 0) takeInput();
  if (waits[2].revents != 0) giveInput();
  if (waits[3].revents != 0 || (ended_ && output_.empty())) takeOutput();
  if (waits[4].revents != 0) giveOutput();
  // Whoever ends it does not wait until a terminal that was held up goes on.
  if (ended_ && isEnding_ && waits[4].fd >= 0 && waits[4].revents == 0) hangUp();
  if ((waits[1].revents & POLLHUP) != 0) hangUp();
}

void OwnTerminal::takeSignals() {
  signalfd_siginfo signal{};
  while (::read(signals_.get(), &signal, sizeof(signal)) == sizeof(signal)) takeSignal(static_cast<int>(signal.ssi_signo));
}

void OwnTerminal::takeSignal(int number) {
  if (number == SIGTSTP) return stop();
  if (number == SIGCONT) wasInFront_ = false;  // others may have set the terminal meanwhile
  if (number == SIGCONT || number == SIGWINCH) return giveSize();
  if (number != SIGCHLD) return pass(number == starterEnded() ? SIGKILL : number);
  int status = 0;
  if (!ended_ && ::waitpid(child_, &status, WNOHANG) == child_) ended_ = status;
}

// The child may have been stopped together with this process, and continued alone it would not be.
void OwnTerminal::pass(int number) {
  if (ended_) return hangUp();
  isEnding_ = true;
  ::kill(child_, number);
  ::kill(child_, SIGCONT);
}

// By the signal's own action, which the kernel leaves out where nobody could continue this process.
void OwnTerminal::stop() {
  user_.leaveRawMode();
  wasInFront_ = false;
  const sigset_t one = setOf(SIGTSTP);
  ::raise(SIGTSTP);
  ::sigprocmask(SIG_UNBLOCK, &one, nullptr);
  ::sigprocmask(SIG_BLOCK, &one, nullptr);
}

void OwnTerminal::giveSize() {
  const auto size = user_.size();
  if (own_ && size) ::ioctl(own_.get(), TIOCSWINSZ, &*size);
}

void OwnTerminal::takeInput() {
  ssize_t count = 0;
  std::string typed = piece(user_.input(), count);
  if (!isInterrupted()) input_ = std::move(typed);
}

void OwnTerminal::giveInput() {
  if (!own_) return;
  const ssize_t count = ::write(own_.get(), input_.data(), input_.size());
  if (count > 0) input_.erase(0, static_cast<std::size_t>(count));
  if (count < 0 && !isEmptyForNow()) input_.clear();
}

void OwnTerminal::takeOutput() {
  ssize_t count = 0;
  output_ = piece(own_.get(), count);
  if (count > 0 || (count < 0 && isEmptyForNow() && !ended_)) return;
  own_.reset();
  input_.clear();
}

void OwnTerminal::giveOutput() {
  const ssize_t count = ::write(user_.output(), output_.data(), output_.size());
  if (count > 0) output_.erase(0, static_cast<std::size_t>(count));
  if (count < 0 && !isEmptyForNow()) hangUp();
}

// The user's terminal is gone, or nobody waits for what is still to come: so is the application's.
void OwnTerminal::hangUp() {
  own_.reset();
  input_.clear();
  output_.clear();
}

}  // namespace docuvend
