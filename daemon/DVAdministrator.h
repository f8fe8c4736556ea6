// Serves one connection of the administration: the access control list through the store's own operations, the first unlock, and how the
// daemon is. Whether the peer may ask has been decided when it connected.
//
// Its operations run on the connection's own context, one after another, and answer inside the call. An empty reply handler is never
// called.
#pragma once

#include <memory>
#include <optional>
#include <vector>

#include "acl/DVGrantTree.h"
#include "platform/rpc.h"
#include "service/DVAdministration.h"

namespace docuvend {

class DVAdministrator final : public DVAdministration {
 public:
  explicit DVAdministrator(std::weak_ptr<QXRpcConnection> connection) : connection_(std::move(connection)) {}

  void statusCompletionHandler(StatusReply completionHandler) override;
  void grantsOfProviderID(std::optional<ProviderID> providerID, std::optional<ConsumerID> toConsumerID,
                          std::optional<std::int64_t> startingAt, GrantsReply completionHandler) override;
  void revokeItemID(std::optional<ItemID> itemID, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> toConsumerID,
                    ErrorReply completionHandler) override;
  void announceFirstUnlockCompletionHandler(ErrorReply completionHandler) override;

 private:
  const std::weak_ptr<QXRpcConnection> connection_;

  // Only in operations: the access control list as it was when its first page was asked for.
  std::vector<DVGrant> listed_;
};

}  // namespace docuvend
