#include "platform/linux/wire/OutgoingCalls.h"

#include <iterator>
#include <set>

#include "platform/linux/wire/Limits.h"

namespace docuvend::linux_platform {
namespace {

// Refusals of older messages that want no reply are not told.
constexpr std::size_t kMaximumUnconfirmedCalls = 1024;

}  // namespace

bool OutgoingCalls::isFull() const { return waiting_.size() >= kMaximumPendingCalls; }

void OutgoingCalls::add(Call call, Forgotten& forgotten) {
  auto& calls = call.reply ? waiting_ : unconfirmed_;
  calls.emplace(nextID_++, std::move(call));
  if (unconfirmed_.size() > kMaximumUnconfirmedCalls) forgetUnconfirmedBefore(std::next(unconfirmed_.begin()), forgotten);
}

void OutgoingCalls::forgetUnconfirmedBefore(std::map<std::uint64_t, Call>::iterator end, Forgotten& forgotten) {
  for (auto call = unconfirmed_.begin(); call != end; ++call) forgotten.push_back(std::move(call->second));
  unconfirmed_.erase(unconfirmed_.begin(), end);
}

std::optional<OutgoingCalls::Call> OutgoingCalls::settle(std::uint64_t callID, Forgotten& forgotten) {
  std::optional<Call> settled;
  if (auto node = waiting_.extract(callID)) {
    settled = std::move(node.mapped());
  } else if (auto refused = unconfirmed_.extract(callID)) {
    settled = std::move(refused.mapped());
  }
  forgetUnconfirmedBefore(unconfirmed_.lower_bound(callID), forgotten);
  return settled;
}

std::vector<OutgoingCalls::Lost> OutgoingCalls::settleAll(const std::vector<std::uint64_t>& unwritten, Forgotten& forgotten) {
  const std::set<std::uint64_t> unsent(unwritten.begin(), unwritten.end());
  for (const std::uint64_t callID : unsent) {
    if (auto node = unconfirmed_.extract(callID)) waiting_.insert(std::move(node));
  }
  forgetUnconfirmedBefore(unconfirmed_.end(), forgotten);
  std::vector<Lost> calls;
  for (auto& [callID, call] : waiting_) {
    calls.push_back({std::move(call), unsent.contains(callID) ? MessageFate::unsent : MessageFate::unanswered});
  }
  waiting_.clear();
  return calls;
}

}  // namespace docuvend::linux_platform
