// A token is issued for a path in a container that the registry has named. The order makes sure that the session has been told of that
// container by then: a change marks this object as stale before it does so with the containers, and whoever issues asks the containers
// first and this object then.
#include "platform/linux/sandbox/TokenPlaces.h"

#include <string_view>
#include <vector>

namespace docuvend::linux_platform {
namespace {

constexpr std::string_view kEverything = "/";

std::string described(const std::set<std::pair<std::string, std::string>>& memberships) {
  std::string text = "docuvend-token-places:1\n";
  for (const auto& [bundle, container] : memberships) text.append(bundle).append(":").append(escapedPath(container)).append("\n");
  return text;
}

}  // namespace

TokenPlaces::TokenPlaces(BundleRegistry& registry, TokenSession& session, GroupContainers& containers, RedemptionLedger& ledger)
    : registry_(registry), session_(session), containers_(containers), ledger_(ledger) {
  registry_.onChange([stale = stale_] { stale->store(true); });
}

std::vector<std::string> TokenPlaces::leftSince(const Memberships& now) {
  if (!known_)
    return session_.hadOtherPlaces(described(now)) ? containers_.spellingsOf(std::string(kEverything)) : std::vector<std::string>();
  std::set<std::string> left;
  for (const auto& membership : *known_) {
    if (now.contains(membership)) continue;
    for (auto& spelling : containers_.spellingsOf(membership.second)) left.insert(std::move(spelling));
  }
  return {left.begin(), left.end()};
}

std::optional<QXError> TokenPlaces::follow() {
  const std::lock_guard lock(mutex_);
  stale_->store(false);
  Memberships now;
  for (const Bundle& bundle : registry_.all()) {
    for (const auto& [group, container] : bundle.groups) now.emplace(bundle.identifier, container);
  }
  if (known_ == now) return std::nullopt;
  const auto left = leftSince(now);
  auto error = session_.changePlaces(described(now), left);
  ledger_.forgetBelow(left);
  unsettled_.insert(unsettled_.end(), left.begin(), left.end());
  known_ = std::move(now);
  return error;
}

void TokenPlaces::followChanges() {
  // What could not be written is tried again by whoever issues, and refused to him.
  if (stale_->load()) static_cast<void>(follow());
}

void TokenPlaces::settle() {
  std::vector<std::string> left;
  {
    const std::lock_guard lock(mutex_);
    left.swap(unsettled_);
  }
  // The log says who is late.
  static_cast<void>(session_.waitForUses(left));
  // What somebody entered who had looked at his token before. Who is late looks again, and enters nothing.
  ledger_.forgetBelow(left);
}

std::optional<QXError> TokenPlaces::takeBack(const std::optional<std::string>& directory) {
  auto error = follow();
  settle();
  auto cutError = session_.takeBack(containers_.spellingsOf(directory.value_or(std::string(kEverything))));
  ledger_.forgetAll();
  return cutError ? cutError : error;
}

}  // namespace docuvend::linux_platform
