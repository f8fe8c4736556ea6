#include "platform/linux/rpc/ConnectionLimiter.h"

#include <utility>

namespace docuvend::linux_platform {

ConnectionLimiter::Admission ConnectionLimiter::admit(const std::string& peer, std::size_t limit) {
  {
    const std::lock_guard lock(mutex_);
    Count& count = counts_[peer];
    if (count.open >= limit) {
      return {std::exchange(count.refusing, true) ? Verdict::refusedAgain : Verdict::refused, nullptr};
    }
    ++count.open;
  }
  return {Verdict::admitted, std::make_unique<Place>(shared_from_this(), peer)};
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
  if (--found->second.open == 0) counts_.erase(found);
}

}  // namespace docuvend::linux_platform
