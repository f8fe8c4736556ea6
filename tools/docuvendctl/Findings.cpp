#include "tools/docuvendctl/Findings.h"

#include <algorithm>
#include <utility>

#include "platform/linux/launch/LaunchArguments.h"
#include "platform/linux/launch/policy/Landlock.h"

namespace docuvend::ctl {
namespace {

using linux_platform::KernelFacilities;
using linux_platform::ProtectionLevels;

std::string_view nameOf(Verdict verdict) {
  switch (verdict) {
    case Verdict::inForce:
      return "in force";
    case Verdict::missing:
      return "missing";
    case Verdict::fatal:
      break;
  }
  return "fatal";
}

// In force, or with a problem as bad as that.
Finding judged(std::string protection, const MachineFacts::Problem& problem, Verdict otherwise, std::string whenWell) {
  if (problem) return {std::move(protection), otherwise, *problem};
  return {std::move(protection), Verdict::inForce, std::move(whenWell)};
}

Finding ofUser(const MachineFacts& facts) {
  if (facts.isRoot) return {"ordinary user", Verdict::fatal, "root runs this: nothing is ever started for root"};
  return {"ordinary user", Verdict::inForce, "not root"};
}

// Where only bubblewrap has a permission to make them, a launch shows it.
Finding ofUserNamespaces(const MachineFacts& facts) {
  const bool isGivenToBubblewrap = facts.userNamespaceProblem && !facts.launchProblem;
  if (isGivenToBubblewrap) return {"user namespaces", Verdict::inForce, "bubblewrap alone may make one"};
  return judged("user namespaces", facts.userNamespaceProblem, Verdict::fatal, "one was made");
}

Finding ofProgram(std::string name, const std::string& path, std::string whenAbsent) {
  if (path.empty()) return {std::move(name), Verdict::fatal, std::move(whenAbsent)};
  return {std::move(name), Verdict::inForce, path};
}

Finding ofLandlock(const MachineFacts& facts) {
  const int level = facts.kernel.landlockLevel;
  if (level < 1) return {"Landlock", Verdict::fatal, "the kernel has none, or has it switched off (5.13)"};
  return judged("Landlock", facts.landlockProblem, Verdict::fatal, "level " + std::to_string(level) + "; a process was restricted with it");
}

// What the kernel holds from some level of Landlock on.
Finding fromLevel(std::string protection, int level, const MachineFacts& facts, std::string whenHeld, std::string otherwise) {
  const bool isHeld = facts.kernel.landlockLevel >= level;
  return {std::move(protection), isHeld ? Verdict::inForce : Verdict::missing, isHeld ? std::move(whenHeld) : std::move(otherwise)};
}

Finding ofKernel(std::string protection, bool isThere, const std::string& sentence) {
  return {std::move(protection), isThere ? Verdict::inForce : Verdict::missing, sentence};
}

Finding ofDaemon(const MachineFacts& facts) {
  if (!facts.daemon) return {"daemon", Verdict::missing, facts.daemonProblem};
  return {"daemon", Verdict::inForce, "process " + std::to_string(facts.daemon->processIdentifier) + " answers"};
}

Finding ofDaemonsKernel(const MachineFacts& facts, const ProtectionLevels& levels) {
  if (!facts.daemon) return {"daemon's kernel", Verdict::missing, "not known without a daemon"};
  const std::vector<std::string> expected = {levels.peers, levels.namespaces, levels.tokens, levels.descriptors, levels.confinement};
  const auto& told = facts.daemon->protections;
  const auto other = std::find_if(told.begin(), told.end(), [&expected](const std::string& sentence) {
    return std::find(expected.begin(), expected.end(), sentence) == expected.end();
  });
  if (other != told.end()) return {"daemon's kernel", Verdict::missing, "the daemon says: " + *other};
  if (told.size() != expected.size())
    return {"daemon's kernel", Verdict::missing, "the daemon does not say which protections are in force"};
  return {"daemon's kernel", Verdict::inForce, "the daemon finds the same protections in force"};
}

Finding ofDaemonsPrivileges(const MachineFacts& facts) {
  const auto missing = [](std::string text) { return Finding{"daemon's privileges", Verdict::missing, std::move(text)}; };
  if (!facts.daemon) return missing("not known without a daemon");
  const auto& privileges = facts.daemon->privileges;
  if (!privileges) return missing("they cannot be read");
  if (privileges->isRoot) return missing("it runs as root");
  if (privileges->hasCapabilities) return missing("it has capabilities");
  if (!privileges->hasNoNewPrivileges) return missing("it could gain privileges by executing (no_new_privs is not set)");
  if (!privileges->isInThisUserNamespace) return missing("it is in another user namespace, where it takes every application for nobody");
  return {"daemon's privileges", Verdict::inForce, "no capability, and none to gain (no_new_privs)"};
}

}  // namespace

std::vector<Finding> findingsFrom(const MachineFacts& facts) {
  const KernelFacilities& kernel = facts.kernel;
  const ProtectionLevels levels = protectionLevels(kernel);
  return {
      ofUser(facts),
      judged("run-time directory", facts.runtimeProblem, Verdict::fatal, facts.runtimeDirectory + " is this user's alone"),
      ofUserNamespaces(facts),
      ofProgram("bubblewrap", facts.bubblewrap, "it is not installed"),
      ofProgram("docuvend-confine", facts.helper, "it is neither beside this program nor in ../libexec/docuvend"),
      ofLandlock(facts),
      judged("system calls", facts.systemCallsProblem, Verdict::fatal, "a process was refused those that reach what all of a user share"),
      judged("confinement", facts.launchProblem, Verdict::fatal, "a confined process was started"),
      fromLevel("truncation", linux_platform::kLandlockTruncateLevel, facts, "Landlock holds it",
                "the read-only mounts alone hold it (6.2)"),
      fromLevel("device requests", linux_platform::kLandlockDevicesLevel, facts, "Landlock holds them",
                "the devices of a confinement take any request (6.10)"),
      fromLevel("abstract sockets, signals", linux_platform::kLandlockScopesLevel, facts, "Landlock holds them",
                "applications have no network, and an extension can reach abstract sockets (6.12)"),
      fromLevel("processes of an extension", linux_platform::kProcessLimitLevel, facts,
                "they are counted and limited, and so are an application's", "they have no limit, and an application's have none (5.14)"),
      ofKernel("peers", kernel.peerPidfd, levels.peers),
      ofKernel("namespaces", kernel.pidfdNamespaces, levels.namespaces),
      ofKernel("audit tokens", kernel.uniquePidfdInodes, levels.tokens),
      ofKernel("sent descriptors", kernel.refusedDescriptors, levels.descriptors),
      judged("directories", facts.placesProblem, Verdict::fatal, "no application sees more than its own"),
      judged("bundles", facts.bundlesProblem, Verdict::missing, "nobody else can write where they lie"),
      judged("watches", facts.watchesProblem, Verdict::missing, "the kernel watches further sockets for this user"),
      ofDaemon(facts),
      ofDaemonsKernel(facts, levels),
      ofDaemonsPrivileges(facts),
  };
}

Report reportOf(const std::vector<Finding>& findings) {
  Report report{{{"protection", "state", "finding"}, {}}, ExitStatus::done};
  Verdict worst = Verdict::inForce;
  for (const Finding& finding : findings) {
    worst = std::max(worst, finding.verdict);
    report.list.rows.push_back({QXValue(finding.protection), QXValue(std::string(nameOf(finding.verdict))), QXValue(finding.text)});
  }
  if (worst == Verdict::missing) report.status = ExitStatus::protectionMissing;
  if (worst == Verdict::fatal) report.status = ExitStatus::nothingStarts;
  return report;
}

}  // namespace docuvend::ctl
