// Bundles whose executable tries things (see probe/main.cpp), and their processes.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/types.h>
#include <unistd.h>

#include <map>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/launch/ConfinedLaunch.h"
#include "tests/bundles/BundleHouse.h"

namespace docuvend::linux_platform {

// Ended at the latest when the object goes.
class RunningProcess {
 public:
  RunningProcess(pid_t pid, UniqueDescriptor output) : pid_(pid), output_(std::move(output)) {}
  RunningProcess(RunningProcess&& other) noexcept;
  RunningProcess& operator=(RunningProcess&&) = delete;
  ~RunningProcess();

  [[nodiscard]] pid_t pid() const { return pid_; }
  // Everything that it writes, until it ends; and how it ended, as a shell says it.
  [[nodiscard]] std::string output();
  [[nodiscard]] int status();

 private:
  pid_t pid_;
  UniqueDescriptor output_;
  std::optional<int> status_;
};

// Starts a function's work in a child, which ends with its result.
template <class Work>
RunningProcess startChild(Work work, int standardInput = -1) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
  UniqueDescriptor output(ends[0]);
  const UniqueDescriptor input(ends[1]);
  const pid_t pid = ::fork();
  if (pid < 0) throw std::runtime_error("no child");
  if (pid == 0) {
    if (standardInput >= 0) ::dup2(standardInput, STDIN_FILENO);
    ::dup2(input.get(), STDOUT_FILENO);
    ::_exit(work());
  }
  return RunningProcess(pid, std::move(output));
}

// What the probe said, "what subject" to outcome.
using Outcomes = std::map<std::string, std::string>;

class ConfinedHouse : public BundleHouse {
 public:
  // Installs the probe, and gives the bundle as a look at the disk finds it.
  [[nodiscard]] Bundle installProbe(const std::string& identifier, const std::string& more = {});

  [[nodiscard]] LaunchPlan plan(const Bundle& bundle, const std::vector<std::string>& attempts);
  [[nodiscard]] LaunchPlan planExtension(const Bundle& bundle, const std::vector<std::string>& attempts, UniqueDescriptor socket);

  [[nodiscard]] static RunningProcess start(LaunchPlan plan, int standardInput = -1);
  [[nodiscard]] static Outcomes outcomes(RunningProcess process);
  // Runs an application to its end.
  [[nodiscard]] Outcomes run(const Bundle& bundle, const std::vector<std::string>& attempts, int standardInput = -1);
  // The same of the probe alone, outside of every confinement, in this house's root.
  [[nodiscard]] Outcomes runUnconfined(const std::vector<std::string>& attempts, int standardInput = -1) const;
};

// A test that means nothing when root runs it says so instead.
class ConfinedTest : public ::testing::Test {
 protected:
  void SetUp() override;
  ConfinedHouse house_;
};

[[nodiscard]] std::string readAll(int descriptor);
[[nodiscard]] int exitStatus(int waitStatus);

}  // namespace docuvend::linux_platform
