// What a connection's peer may ask of this end, beside what holds for every peer.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/base/LogSubject.h"
#include "platform/linux/wire/CallBudget.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/linux/wire/UntakenDescriptors.h"

namespace docuvend::linux_platform {

struct CallRules {
  // What its unanswered requests take, besides the connection's own limits; may be empty and shared with other connections.
  std::shared_ptr<CallBudget> budget;
  // The operations that it may ask for, when these are not all: every other request fails.
  std::optional<std::vector<std::string>> operations;
  // Those that give something back: they take nothing of any limit, or who has reached one could not get away from it.
  std::vector<std::string> releasing;
  // For whom its requests are run.
  LogSubject::Name subject;
  // Of a peer that is not trusted, shared by its connections: one of them is served at a time, and only as long as it takes its answers.
  // Empty for others.
  std::shared_ptr<Reactor::Lane> lane;
  // Where the descriptors that such a peer is sent are counted, shared in the same way. May be empty: they are not.
  std::shared_ptr<UntakenDescriptors> untaken = {};
};

}  // namespace docuvend::linux_platform
