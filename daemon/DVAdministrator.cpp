#include "daemon/DVAdministrator.h"

#include <cerrno>
#include <string>
#include <utility>
#include <vector>

#include "acl/DVAccessControlStore.h"
#include "common/DVErrors.h"
#include "common/DVLog.h"
#include "daemon/DVGrantPage.h"
#include "platform/QXPlatform.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVRequests.h"

namespace docuvend {
namespace {

// The containers of all groups that the provider's bundle belongs to: an update may have changed which of them has its documents, while
// tokens for a container that it has left have ended with that. None when nothing is known of the provider: then a token may lie anywhere.
std::vector<std::string> containersOf(const ProviderID& providerID) {
  std::vector<std::string> containers;
  const auto provider = DVExtensionDocuvend::providerWithIdentifier(providerID);
  const auto record = QXPlatform::current().applicationRegistry.recordForIdentifier(providerID.value);
  if (!provider || !provider->providedItemsURL() || !record) return containers;
  for (const auto& [group, container] : record->groupContainers()) containers.push_back(container.fileSystemPath());
  return containers;
}

std::optional<QXError> takeBackTokens(const ProviderID& providerID) {
  QXSandbox& sandbox = QXPlatform::current().sandbox;
  const auto containers = containersOf(providerID);
  if (containers.empty()) return sandbox.invalidateReadWriteExtensions(/*directory=*/std::nullopt);
  std::optional<QXError> firstError;
  for (const std::string& container : containers) {
    auto error = sandbox.invalidateReadWriteExtensions(container);
    if (!firstError) firstError = std::move(error);
  }
  return firstError;
}

// The list first: from then on it entitles nobody to a new token, and the old ones go after that. When the list could not be written they
// go all the same, for it holds in memory. Then the same revocation, asked for again, finds no grant but has the list written: it is not
// told that there was nothing to revoke.
std::optional<QXError> revoke(const ProviderID& providerID, const ItemID& itemID, const ConsumerID& consumerID) {
  DVAccessControlStore& store = *DVAccessControlStore::sharedStore();
  if (store.isProviderWithIdentifier(providerID, itemID, consumerID)) {
    store.disallowProviderWithIdentifier(providerID, itemID, consumerID);
  } else if (store.hasUnwrittenChanges()) {
    store.writeUnwrittenChanges();
  } else {
    return DVNotFoundError(itemID);
  }
  const bool isOnDisk = !store.hasUnwrittenChanges();
  auto tokensError = takeBackTokens(providerID);
  if (!isOnDisk) return QXError::system(EIO, "the access control list could not be written; when it is read again the grant is back");
  return tokensError;
}

}  // namespace

void DVAdministrator::statusCompletionHandler(StatusReply completionHandler) {
  const QXPlatform& platform = QXPlatform::current();
  QXDictionary status = platform.status.platformStatus();
  status.insert_or_assign("version", DOCUVEND_VERSION);
  status.insert_or_assign("lockState", platform.deviceLock.lockState());
  status.insert_or_assign("unlockedSinceBoot", platform.deviceLock.unlockedSinceBoot());
  status.insert_or_assign("providers", DVExtensionDocuvend::providersInfo());
  status.insert_or_assign("grants", static_cast<std::int64_t>(DVAccessControlStore::sharedStore()->grants().size()));
  if (completionHandler) completionHandler(/*error=*/std::nullopt, std::move(status));
}

void DVAdministrator::grantsOfProviderID(std::optional<ProviderID> providerID, std::optional<ConsumerID> toConsumerID,
                                         std::optional<std::int64_t> startingAt, GrantsReply completionHandler) {
  const std::int64_t start = startingAt.value_or(0);
  if (start == 0) listed_ = DVAccessControlStore::sharedStore()->grants();
  if (!completionHandler) return;
  if (start < 0 || start > static_cast<std::int64_t>(listed_.size())) {
    completionHandler(DVInvalidParameterError("startingAt", std::to_string(start)), /*grants=*/std::nullopt, /*next=*/std::nullopt);
    return;
  }
  auto page = DVGrantPage::of(listed_, {std::move(providerID), std::move(toConsumerID)}, static_cast<std::size_t>(start));
  completionHandler(/*error=*/std::nullopt, std::move(page.grants), page.next);
}

void DVAdministrator::revokeItemID(std::optional<ItemID> itemID, std::optional<ProviderID> fromProviderID,
                                   std::optional<ConsumerID> toConsumerID, ErrorReply completionHandler) {
  auto error = dvMissingParameter("itemID", itemID, fromProviderID, toConsumerID);
  if (!error) error = revoke(*fromProviderID, *itemID, *toConsumerID);
  if (completionHandler) completionHandler(std::move(error));
}

void DVAdministrator::announceFirstUnlockCompletionHandler(ErrorReply completionHandler) {
  const auto client = connection_.lock();
  dvLog("[NOTICE] PID %d announces the first unlock.", client ? client->processIdentifier() : 0);
  QXPlatform::current().notificationCenter.post(kQXFirstUnlockNotification);
  if (completionHandler) completionHandler(/*error=*/std::nullopt);
}

}  // namespace docuvend
