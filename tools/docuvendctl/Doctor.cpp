#include "tools/docuvendctl/Doctor.h"

#include <unistd.h>

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <variant>

#include "platform/linux/base/Paths.h"
#include "platform/linux/launch/HostLayout.h"
#include "platform/linux/launch/PrivatePlaces.h"
#include "tools/docuvendctl/ConnectionOptions.h"
#include "tools/docuvendctl/Findings.h"
#include "tools/docuvendctl/Outcome.h"
#include "tools/docuvendctl/Place.h"
#include "tools/docuvendctl/Trials.h"
#include "tools/docuvendctl/WritableByOthers.h"

namespace docuvend::ctl {
namespace {

using linux_platform::HostLayout;
using linux_platform::KernelFacilities;
using linux_platform::Paths;

// A daemon that hangs is found out sooner than by who needs it.
constexpr std::chrono::milliseconds kPatience{5'000};

DaemonFacts factsFrom(const QXDictionary& status) {
  DaemonFacts facts;
  if (const auto* number = qxFind<std::int64_t>(status, "processIdentifier")) facts.processIdentifier = *number;
  if (const auto* sentences = qxFind<QXArray>(status, "protections")) {
    for (const QXValue& sentence : *sentences) facts.protections.push_back(sentence.as<std::string>() ? *sentence.as<std::string>() : "");
  }
  facts.privileges = privilegesOf(facts.processIdentifier);
  return facts;
}

void askDaemon(const Call& call, MachineFacts& facts) {
  auto connected = Administrator::connect(administratorOptions(call.deadline.value_or(kPatience)));
  if (const auto* error = std::get_if<QXError>(&connected)) {
    facts.daemonProblem = "none answers: " + messageOf(*error);
    return;
  }
  auto told = std::get<std::unique_ptr<Administrator>>(connected)->status();
  if (const auto* error = std::get_if<QXError>(&told)) {
    facts.daemonProblem = "it does not say how it is: " + messageOf(*error);
    return;
  }
  facts.daemon = factsFrom(std::get<QXDictionary>(told));
}

void lookAtPlaces(const Result<Paths>& found, const HostLayout& host, MachineFacts& facts) {
  if (const auto* error = std::get_if<QXError>(&found)) {
    facts.runtimeProblem = messageOf(*error);
    facts.placesProblem = facts.bundlesProblem = "not looked at without a run-time directory";
    return;
  }
  const Paths& paths = std::get<Paths>(found);
  facts.runtimeDirectory = paths.runtime.substr(0, paths.runtime.rfind('/'));
  facts.placesProblem = linux_platform::exposedPlace(host, paths);
  facts.bundlesProblem = writableByOthers(paths.systemBundles);
  if (!facts.bundlesProblem) facts.bundlesProblem = writableByOthers(paths.userBundles);
}

}  // namespace

Result<Answer> doctor(const Call& call) {
  const auto paths = unconfinedPaths();
  const auto* error = std::get_if<QXError>(&paths);
  if (error != nullptr && error->domain == kControlErrorDomain) return *error;

  MachineFacts facts;
  facts.isRoot = ::geteuid() == 0;
  facts.kernel = KernelFacilities::probe();
  const HostLayout host = HostLayout::read();
  facts.bubblewrap = host.bubblewrap;
  facts.helper = host.helper;
  facts.userNamespaceProblem = tryUserNamespace();
  if (facts.kernel.landlockLevel > 0) facts.landlockProblem = tryLandlock(facts.kernel.landlockLevel);
  facts.systemCallsProblem = trySystemCalls();
  facts.launchProblem = tryLaunch();
  lookAtPlaces(paths, host, facts);
  facts.watchesProblem = tryWatch();
  // Last: it starts threads.
  askDaemon(call, facts);
  return Answer(reportOf(findingsFrom(facts)));
}

}  // namespace docuvend::ctl
