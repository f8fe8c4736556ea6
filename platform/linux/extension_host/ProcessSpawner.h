// Makes processes, all from one thread that lives as long as the spawner.
//
// A confinement asks the kernel to be ended together with its parent, and to the kernel the parent is the *thread* that made the process:
// a process spawned from a pool thread would die when the pool shrinks.
#pragma once

#include <sys/types.h>

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>
#include <variant>

#include "platform/QXError.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/launch/ConfinedLaunch.h"

namespace docuvend::linux_platform {

struct SpawnedProcess {
  pid_t number = 0;
  UniqueDescriptor descriptor;  // a pidfd; whoever has it must reap the process through it
};

class ProcessSpawner {
 public:
  ProcessSpawner();
  // `stop` has been called.
  ~ProcessSpawner();
  ProcessSpawner(const ProcessSpawner&) = delete;
  ProcessSpawner& operator=(const ProcessSpawner&) = delete;

  // Runs the task on the spawner's thread, in order. False: stopped, the task was dropped.
  [[nodiscard]] bool perform(std::function<void()> task);
  // Waits for the task that runs, drops the others and ends the thread. Not from a task.
  void stop();

  // On the spawner's thread. Executes the plan with standard input from nowhere and both outputs into `output`; signals are as in a fresh
  // process. The new process leads a process group of its own.
  [[nodiscard]] std::variant<SpawnedProcess, QXError> spawn(LaunchPlan plan, const UniqueDescriptor& output);

 private:
  void run();

  std::mutex mutex_;  // guards the two below
  std::deque<std::function<void()>> tasks_;
  bool stopped_ = false;
  std::condition_variable changed_;
  std::thread thread_;
};

}  // namespace docuvend::linux_platform
