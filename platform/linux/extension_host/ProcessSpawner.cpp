#include "platform/linux/extension_host/ProcessSpawner.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>

#include <algorithm>
#include <cassert>
#include <cerrno>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/base/pidfd.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kFirstInheritedNumber = 3;

// The steps between the new process and its program. Errors of adding a step are remembered.
class FileActions {
 public:
  FileActions() { error_ = posix_spawn_file_actions_init(&actions_); }
  ~FileActions() { posix_spawn_file_actions_destroy(&actions_); }
  FileActions(const FileActions&) = delete;
  FileActions& operator=(const FileActions&) = delete;

  void openNothing(int number) { note(posix_spawn_file_actions_addopen(&actions_, number, "/dev/null", O_RDONLY, 0)); }
  void place(int descriptor, int number) { note(posix_spawn_file_actions_adddup2(&actions_, descriptor, number)); }
  void close(int number) { note(posix_spawn_file_actions_addclose(&actions_, number)); }
  void closeFrom(int number) { note(posix_spawn_file_actions_addclosefrom_np(&actions_, number)); }

  [[nodiscard]] int error() const { return error_; }
  [[nodiscard]] const posix_spawn_file_actions_t* get() const { return &actions_; }

 private:
  void note(int error) {
    if (error_ == 0) error_ = error;
  }

  posix_spawn_file_actions_t actions_{};
  int error_ = 0;
};

class Attributes {
 public:
  Attributes() {
    posix_spawnattr_init(&attributes_);
    sigset_t signals;
    sigemptyset(&signals);
    posix_spawnattr_setsigmask(&attributes_, &signals);
    sigfillset(&signals);
    posix_spawnattr_setsigdefault(&attributes_, &signals);
    posix_spawnattr_setpgroup(&attributes_, 0);
    posix_spawnattr_setflags(&attributes_, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETPGROUP);
  }
  ~Attributes() { posix_spawnattr_destroy(&attributes_); }
  Attributes(const Attributes&) = delete;
  Attributes& operator=(const Attributes&) = delete;

  [[nodiscard]] const posix_spawnattr_t* get() const { return &attributes_; }

 private:
  posix_spawnattr_t attributes_{};
};

std::vector<char*> pointers(std::vector<std::string>& texts) {
  std::vector<char*> result;
  result.reserve(texts.size() + 1);
  for (std::string& text : texts) result.push_back(text.data());
  result.push_back(nullptr);
  return result;
}

}  // namespace

ProcessSpawner::ProcessSpawner() : thread_(&ProcessSpawner::run, this) {}

ProcessSpawner::~ProcessSpawner() { assert(!thread_.joinable()); }

bool ProcessSpawner::perform(std::function<void()> task) {
  {
    const std::lock_guard lock(mutex_);
    if (stopped_) return false;
    tasks_.push_back(std::move(task));
  }
  changed_.notify_one();
  return true;
}

void ProcessSpawner::stop() {
  std::deque<std::function<void()>> dropped;
  {
    const std::lock_guard lock(mutex_);
    stopped_ = true;
    dropped.swap(tasks_);
  }
  changed_.notify_one();
  if (thread_.joinable()) thread_.join();
}

void ProcessSpawner::run() {
  for (;;) {
    std::function<void()> task;
    {
      std::unique_lock lock(mutex_);
      changed_.wait(lock, [this] { return stopped_ || !tasks_.empty(); });
      if (stopped_) return;
      task = std::move(tasks_.front());
      tasks_.pop_front();
    }
    task();
  }
}

std::variant<SpawnedProcess, QXError> ProcessSpawner::spawn(LaunchPlan plan, const UniqueDescriptor& output) {
  assert(std::this_thread::get_id() == thread_.get_id());
  assert(!plan.arguments.empty());

  // Everything that is to be placed moves above every place first, so that no step overwrites what a later one needs.
  int end = kFirstInheritedNumber;
  for (const auto& inherited : plan.inherited) end = std::max(end, inherited.number + 1);
  for (auto& inherited : plan.inherited) {
    inherited.descriptor = UniqueDescriptor(fcntl(inherited.descriptor.get(), F_DUPFD_CLOEXEC, end));
    if (!inherited.descriptor) return QXError::system(errno, "a descriptor for a new process could not be made");
  }
  const UniqueDescriptor outputCopy(fcntl(output.get(), F_DUPFD_CLOEXEC, end));
  if (!outputCopy) return QXError::system(errno, "a descriptor for a new process could not be made");

  FileActions actions;
  actions.openNothing(0);
  actions.place(outputCopy.get(), 1);
  actions.place(outputCopy.get(), 2);
  for (int number = kFirstInheritedNumber; number < end; ++number) {
    const auto found = std::find_if(plan.inherited.begin(), plan.inherited.end(),
                                    [number](const LaunchPlan::Inherited& inherited) { return inherited.number == number; });
    if (found == plan.inherited.end()) {
      actions.close(number);
    } else {
      actions.place(found->descriptor.get(), number);
    }
  }
  actions.closeFrom(end);
  if (actions.error() != 0) return QXError::system(actions.error(), "a new process could not be prepared");

  const Attributes attributes;
  SpawnedProcess process;
  const int error = posix_spawn(&process.number, plan.arguments.front().c_str(), actions.get(), attributes.get(),
                                pointers(plan.arguments).data(), pointers(plan.environment).data());
  if (error != 0) return QXError::system(error, plan.arguments.front() + " could not be executed");
  // The number cannot be another's: nobody has reaped the process yet.
  process.descriptor = openPidfd(process.number);
  if (!process.descriptor) {
    const int openError = errno;
    kill(process.number, SIGKILL);
    waitpid(process.number, nullptr, 0);
    return QXError::system(openError, "a new process could not be watched");
  }
  return process;
}

}  // namespace docuvend::linux_platform
