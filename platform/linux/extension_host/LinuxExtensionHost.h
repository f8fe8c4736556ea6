// Extensions from the installed bundles, each in a confined process of its own.
//
// A bundle is an extension of a match when its Info.plist's dictionary "QXExtension" has every attribute with that string. Match handlers
// run on a thread that the host keeps for them, so a slow one delays nothing but the next call.
//
// An extension's process does not outlive its bundle. When that is removed, or has lost a group or an entitlement, the process is ended at
// once, whatever it has not answered: messages that wait fail with bundleIsGone, each through its error handler, an answer that comes later
// is not taken, and requests of the old object fail. When it was updated the old process has a grace for what it is about
// (ExtensionTimes::updateGrace says why). The object of the bundle that is installed then has a process of its own.
#pragma once

#include <memory>

#include "platform/QXValue.h"
#include "platform/extension_host.h"
#include "platform/linux/base/Paths.h"
#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/extension_host/ExtensionTimes.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

class LinuxExtensionHost : public QXExtensionHost {
 public:
  // The references outlive the host and every extension that it handed out.
  LinuxExtensionHost(BundleRegistry& bundles, const Paths& paths, Reactor& reactor, QXLogHandle& log, const ExtensionTimes& times = {});
  // Waits for a handler that runs, and ends all processes: messages that wait for an answer fail, and so do requests from now on. Not from
  // a handler.
  ~LinuxExtensionHost() override;

  // The interfaces of the context class outlive the host. Two matches of the same bundle have a process each.
  [[nodiscard]] std::unique_ptr<QXExtensionMatch> beginMatching(Attributes attributes, QXExtensionContextClass contextClass,
                                                                MatchHandler handler) override;

  // How each extension's process fares: a dictionary for each identifier, with
  //   "state"                   "not running", "starting", "running", "ending" or "backing off"
  //   "processIdentifier"       while it runs
  //   "openRequests"            those that wait for the process included
  //   "badLivesInARow"          how often in a row it died quickly or had to be ended
  //   "refusedForMilliseconds"  while it backs off: how long requests fail at once
  // A removed extension is told of while it has a process; an updated one is the new one. May be called from any thread.
  [[nodiscard]] QXDictionary status() const;

 private:
  struct State;
  class Match;

  std::shared_ptr<State> state_;
};

}  // namespace docuvend::linux_platform
