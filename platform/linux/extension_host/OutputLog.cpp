#include "platform/linux/extension_host/OutputLog.h"

#include <sys/epoll.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <mutex>
#include <string_view>
#include <utility>

#include "platform/QXLogMessage.h"
#include "platform/linux/extension_host/OutputLines.h"
#include "platform/linux/log/LineAllowance.h"

namespace docuvend::linux_platform {
namespace {

// Read at one go; a process that writes without end leaves the thread to others in between.
constexpr std::size_t kChunk = 4096;
// What is read at the end, at most: a pipe holds no more unless somebody goes on writing.
constexpr int kLastChunks = 32;

enum class Pipe { maybeMore, empty, over };

}  // namespace

struct OutputLog::State {
  State(QXLogHandle& logHandle, std::string processName, UniqueDescriptor descriptor)
      : log(logHandle),
        name(std::move(processName)),
        pipe(std::move(descriptor)),
        lines([this](const std::string& line) { write(line); }) {}

  void write(const std::string& line) {
    if (!log.isEnabled(QXLogType::info)) return;
    const auto now = std::chrono::steady_clock::now();
    tellOfLeftOut(allowance.dueCount(now));
    if (allowance.line(now)) qxLog(log, "[INFO] %@: %@", name, line);
  }

  void tellOfLeftOut(std::size_t count) const {
    if (count > 0) qxLog(log, "[INFO] %@ wrote %d lines more than are logged.", name, count);
  }

  Pipe readChunk() {
    const std::lock_guard lock(mutex);
    std::array<char, kChunk> buffer{};
    const ssize_t count = read(pipe.get(), buffer.data(), buffer.size());
    if (count > 0) {
      lines.add(std::string_view(buffer.data(), static_cast<std::size_t>(count)));
      return Pipe::maybeMore;
    }
    if (count < 0 && (errno == EAGAIN || errno == EINTR)) return Pipe::empty;
    return Pipe::over;
  }

  void finish() {
    const std::lock_guard lock(mutex);
    lines.finish();
    tellOfLeftOut(allowance.finish());
  }

  QXLogHandle& log;
  const std::string name;
  UniqueDescriptor pipe;
  std::mutex mutex;  // guards the two below and the order of reading
  OutputLines lines;
  LineAllowance allowance{{kLinesAtOnce, kTimeForALine}};
};

OutputLog::OutputLog(Reactor& reactor, QXLogHandle& log, std::string name, UniqueDescriptor pipe)
    : state_(std::make_shared<State>(log, std::move(name), std::move(pipe))) {
  registration_ = reactor.watch(state_->pipe.get(), EPOLLIN, [weak = std::weak_ptr(state_)](std::uint32_t) -> std::uint32_t {
    const auto state = weak.lock();
    if (!state) return 0;
    if (state->readChunk() == Pipe::over) {
      state->finish();
      return 0;
    }
    return EPOLLIN;
  });
}

OutputLog::~OutputLog() {
  registration_.reset();
  for (int i = 0; i < kLastChunks && state_->readChunk() == Pipe::maybeMore; ++i) {
  }
  state_->finish();
}

}  // namespace docuvend::linux_platform
