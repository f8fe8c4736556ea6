// A request may outlive its connection: whoever was asked for it, perhaps a provider, is still at it. A peer is therefore remembered while
// anything holds its budget or its lane, or it has descriptors left to take, and finds them again when it comes back; closing connections
// gives it nothing new. Who is forgotten is looked for when a place is given back: peers are bundles, and few.

#include "platform/linux/rpc/ConnectionLimiter.h"

#include <utility>

namespace docuvend::linux_platform {

ConnectionLimiter::Admission ConnectionLimiter::admit(const std::string& peer, Limits limits) {
  std::shared_ptr<CallBudget> budget;
  std::shared_ptr<Reactor::Lane> lane;
  std::shared_ptr<UntakenDescriptors> untaken;
  {
    const std::lock_guard lock(mutex_);
    Count& count = counts_[peer];
    if (count.open >= limits.connections) {
      return {std::exchange(count.refusing, true) ? Verdict::refusedAgain : Verdict::refused, /*place=*/{}, /*budget=*/{}, /*lane=*/{},
              /*untaken=*/{}};
    }
    if (!count.budget) count.budget = std::make_shared<CallBudget>(limits.calls);
    if (!count.lane) count.lane = Reactor::makeLane();
    if (!count.untaken) count.untaken = std::make_shared<UntakenDescriptors>(kMaximumUntakenDescriptors);
    budget = count.budget;
    lane = count.lane;
    untaken = count.untaken;
    ++count.open;
  }
  return {Verdict::admitted, std::make_unique<Place>(shared_from_this(), peer), std::move(budget), std::move(lane), std::move(untaken)};
}

std::size_t ConnectionLimiter::openConnections() const {
  const std::lock_guard lock(mutex_);
  std::size_t open = 0;
  for (const auto& [peer, count] : counts_) open += count.open;
  return open;
}

void ConnectionLimiter::giveBack(const std::string& peer) {
  const std::lock_guard lock(mutex_);
  const auto found = counts_.find(peer);
  found->second.refusing = false;
  --found->second.open;
  // What this map alone holds nobody can take hold of meanwhile.
  std::erase_if(counts_, [](const auto& counted) { return counted.second.isForgettable(); });
}

}  // namespace docuvend::linux_platform
