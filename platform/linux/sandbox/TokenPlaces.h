// Follows which bundles belong to which groups, so that no token outlives the membership under which it was issued.
//
// A provider's tokens are for files in its document group's container, and which group that is an update may change. What is to be taken
// back of a provider must therefore be found in the containers of the groups that it has now; so when a bundle leaves a group, by an update
// or because it is removed, all tokens for that group's container end. A change that nobody followed, because no daemon ran, is noticed by
// the next one: then all tokens of the session end. May be used from any thread.
#pragma once

#include <atomic>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/QXError.h"
#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/sandbox/GroupContainers.h"
#include "platform/linux/sandbox/RedemptionLedger.h"
#include "platform/linux/sandbox/TokenSession.h"

namespace docuvend::linux_platform {

class TokenPlaces {
 public:
  // All outlive it. The registry tells this object of a change before it tells any that is made later.
  TokenPlaces(BundleRegistry& registry, TokenSession& session, GroupContainers& containers, RedemptionLedger& ledger);

  // Afterwards the session knows what is installed now, and what was issued for containers that a bundle has left since is taken back.
  // After an error the old tokens are refused by this process; a restart may make them good again, and nothing is issued until it is
  // written down. Waits for nobody who acts on such a token.
  [[nodiscard]] std::optional<QXError> follow();
  // The same, if the registry has told of a change since.
  void followChanges();
  // Waits for those, as TokenSession does.
  void settle();

  // Of what is installed now. None: everything.
  [[nodiscard]] std::optional<QXError> takeBack(const std::optional<std::string>& directory);

 private:
  using Memberships = std::set<std::pair<std::string, std::string>>;  // bundle and container

  [[nodiscard]] std::vector<std::string> leftSince(const Memberships& now);

  BundleRegistry& registry_;
  TokenSession& session_;
  GroupContainers& containers_;
  RedemptionLedger& ledger_;
  // Set by the registry's thread, which may outlive this object.
  const std::shared_ptr<std::atomic<bool>> stale_ = std::make_shared<std::atomic<bool>>(true);

  std::mutex mutex_;
  // Guarded by mutex_.
  std::optional<Memberships> known_;    // none until the first look
  std::vector<std::string> unsettled_;  // was left, and nobody has waited yet for those who act on tokens below it
};

}  // namespace docuvend::linux_platform
