#include "platform/linux/log/LogSink.h"

#include <pthread.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <ctime>
#include <utility>

namespace docuvend::linux_platform {
namespace {

constexpr timeval kLongestWaitForTheJournal{1, 0};
// Nobody waits so long after somebody did in vain: a journal that stands still must not slow down every line.
constexpr std::chrono::seconds kTimeBetweenWaits{60};

// Keeps a broken pipe's signal from the calling thread, and takes back the one that its own writing caused.
class WithoutPipeSignal {
 public:
  WithoutPipeSignal() {
    ::sigemptyset(&pipeSignal_);
    ::sigaddset(&pipeSignal_, SIGPIPE);
    sigset_t pending;
    ::sigpending(&pending);
    wasPending_ = ::sigismember(&pending, SIGPIPE) == 1;
    ::pthread_sigmask(SIG_BLOCK, &pipeSignal_, &before_);
  }
  ~WithoutPipeSignal() {
    constexpr timespec kAtOnce{0, 0};
    if (!wasPending_) {
      while (::sigtimedwait(&pipeSignal_, nullptr, &kAtOnce) < 0 && errno == EINTR) {
      }
    }
    ::pthread_sigmask(SIG_SETMASK, &before_, nullptr);
  }
  WithoutPipeSignal(const WithoutPipeSignal&) = delete;
  WithoutPipeSignal& operator=(const WithoutPipeSignal&) = delete;

 private:
  sigset_t pipeSignal_;
  sigset_t before_;
  bool wasPending_;
};

// The journal's priorities are those of syslog.
int priorityOf(QXLogType type) {
  switch (type) {
    case QXLogType::defaultType:
      return 5;
    case QXLogType::info:
      return 6;
    case QXLogType::debug:
      return 7;
    case QXLogType::fault:
      return 2;
  }
  return 2;
}

}  // namespace

StreamLogSink::StreamLogSink(int descriptor, std::string identifier) : descriptor_(descriptor), identifier_(std::move(identifier)) {}

void StreamLogSink::write(std::string_view text) const {
  std::string line = identifier_ + "[" + std::to_string(::getpid()) + "]: ";
  line += text;
  line += '\n';
  const WithoutPipeSignal withoutPipeSignal;
  std::string_view rest = line;
  while (!rest.empty()) {
    const ssize_t count = ::write(descriptor_, rest.data(), rest.size());
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return;
    rest.remove_prefix(static_cast<std::size_t>(count));
  }
}

JournalLogSink::JournalLogSink(std::string socketPath, std::string identifier)
    : socketPath_(std::move(socketPath)), identifier_(std::move(identifier)), socket_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
  if (socket_) ::setsockopt(socket_.get(), SOL_SOCKET, SO_SNDTIMEO, &kLongestWaitForTheJournal, sizeof kLongestWaitForTheJournal);
}

LogWritten JournalLogSink::write(QXLogType type, std::string_view text) const {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (!socket_ || socketPath_.size() >= sizeof address.sun_path) return LogWritten::no;
  std::memcpy(address.sun_path, socketPath_.c_str(), socketPath_.size());
  std::string entry = "PRIORITY=" + std::to_string(priorityOf(type)) + "\nSYSLOG_IDENTIFIER=" + identifier_ + "\nMESSAGE=";
  entry += text;
  entry += '\n';
  const bool mayWait = std::chrono::steady_clock::now() >= waitsAgain_.load();
  const int flags = mayWait ? MSG_NOSIGNAL : MSG_NOSIGNAL | MSG_DONTWAIT;
  ssize_t count = -1;
  do {
    count = ::sendto(socket_.get(), entry.data(), entry.size(), flags, reinterpret_cast<const sockaddr*>(&address), sizeof address);
  } while (count < 0 && errno == EINTR);
  if (count < 0 && mayWait && (errno == EAGAIN || errno == EWOULDBLOCK)) {
    waitsAgain_ = std::chrono::steady_clock::now() + kTimeBetweenWaits;
  }
  return count < 0 ? LogWritten::no : LogWritten::yes;
}

}  // namespace docuvend::linux_platform
