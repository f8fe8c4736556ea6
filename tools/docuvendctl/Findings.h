// What the facts about a machine mean for whoever relies on it: a verdict and a sentence for each protection.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/identity/KernelFacilities.h"
#include "tools/docuvendctl/Answer.h"
#include "tools/docuvendctl/ProcessPrivileges.h"

namespace docuvend::ctl {

struct DaemonFacts {
  std::int64_t processIdentifier = 0;
  std::vector<std::string> protections;         // as it says itself
  std::optional<ProcessPrivileges> privileges;  // absent when they could not be read
};

// A problem is a reason in words, and absent where all is well.
struct MachineFacts {
  using Problem = std::optional<std::string>;

  bool isRoot = false;
  std::string runtimeDirectory;  // of use without a problem
  Problem runtimeProblem;
  Problem userNamespaceProblem;  // making one
  std::string bubblewrap;        // its path, empty when it is not installed
  std::string helper;            // the same of docuvend-confine
  linux_platform::KernelFacilities kernel;
  Problem landlockProblem;     // restricting a process with it
  Problem systemCallsProblem;  // refusing a process some
  Problem launchProblem;       // starting a confined process
  Problem placesProblem;       // what of the user's every application sees
  Problem bundlesProblem;      // who else can change what lies there
  Problem watchesProblem;      // having sockets watched by the kernel
  std::optional<DaemonFacts> daemon;
  std::string daemonProblem;  // why there are no facts about it
};

enum class Verdict {
  inForce,
  missing,  // everything works, with a guarantee less
  fatal,    // no application and no extension can be started
};

struct Finding {
  std::string protection;
  Verdict verdict;
  std::string text;
};

// Always the same protections in the same order.
[[nodiscard]] std::vector<Finding> findingsFrom(const MachineFacts& facts);

// The worst verdict decides how the command ends.
[[nodiscard]] Report reportOf(const std::vector<Finding>& findings);

}  // namespace docuvend::ctl
