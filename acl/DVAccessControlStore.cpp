#include "acl/DVAccessControlStore.h"

#include <cassert>
#include <string>
#include <utility>
#include <variant>

#include "acl/DVGrantLimits.h"
#include "common/DVLog.h"
#include "platform/QXPlatform.h"

namespace docuvend {
namespace {

constexpr const char* kQueueLabel = "DVAccessControlStore sync queue";
constexpr const char* kDirectoryBelowHome = "Library/Docuvend";
constexpr const char* kFileName = "AccessControl.plist";

std::string joined(std::string directory, std::string_view below) {
  if (!directory.ends_with('/')) directory += '/';
  return directory.append(below);
}

std::string madeDirectory() {
  QXFileSystem& files = QXPlatform::current().fileSystem;
  std::string path = joined(files.homeDirectory(), kDirectoryBelowHome);
  if (!files.exists(path)) {
    if (const auto error = files.createDirectory(path)) {
      dvLog("[ERROR] Cannot create access control directory. Error: %@", *error);
    }
  }
  return path;
}

// Made once in the life of the process, together with the directory.
const std::string& accessControlFilePath() {
  static const auto* const path = new std::string(joined(madeDirectory(), kFileName));
  return *path;
}

// What a reader made of the file: the tree if it holds one, and the error to report, the reader's own before ours.
struct Interpretation {
  std::optional<DVGrantTree> tree;
  std::optional<QXError> error;
  bool isMisshapen = false;
};

Interpretation interpreted(QXPropertyLists::ReadResult result) {
  if (!result.value) return {std::nullopt, std::move(result.error)};
  auto tree = DVGrantTree::fromPropertyList(*std::move(result.value));
  if (auto* problem = std::get_if<QXError>(&tree)) {
    return {std::nullopt, result.error ? std::move(result.error) : std::optional(std::move(*problem)), /*isMisshapen=*/true};
  }
  return {std::get<DVGrantTree>(std::move(tree)), std::move(result.error)};
}

}  // namespace

const std::shared_ptr<DVAccessControlStore>& DVAccessControlStore::sharedStore() {
  static const auto* const store = new std::shared_ptr(std::make_shared<DVAccessControlStore>());
  return *store;
}

DVAccessControlStore::DVAccessControlStore() : syncQueue_(QXPlatform::current().queues.serialQueue(kQueueLabel)) {
  QXPlatform::current().notificationCenter.addObserver(
      kQXFirstUnlockNotification, [] { sharedStore()->rereadAccessControl(); }, QXSuspensionBehavior::deliverImmediately);
  syncQueueReadAccessControl();
}

bool DVAccessControlStore::isProviderWithIdentifier(const std::optional<ProviderID>& provider,
                                                    const std::optional<ItemID>& allowedToProvideItemID,
                                                    const std::optional<ConsumerID>& toConsumerWithIdentifier) const {
  if (!provider || !allowedToProvideItemID || !toConsumerWithIdentifier) return false;
  return qxSync(*syncQueue_,
                [&] { return syncQueueAccessControlDict_->allows(*provider, *allowedToProvideItemID, *toConsumerWithIdentifier); });
}

bool DVAccessControlStore::isProviderIdentifier(const std::optional<ProviderID>& provider,
                                                const std::optional<ItemID>& allowedToProvideItemID,
                                                const std::optional<ConsumerID>& toConsumerWithIdentifier) const {
  if (!provider || provider->value.empty()) return false;
  if (!allowedToProvideItemID || allowedToProvideItemID->value.empty()) return false;
  return isProviderWithIdentifier(provider, allowedToProvideItemID, toConsumerWithIdentifier);
}

std::vector<DVGrant> DVAccessControlStore::grants() const {
  return qxSync(*syncQueue_, [&] { return syncQueueAccessControlDict_->grants(); });
}

bool DVAccessControlStore::hasUnwrittenChanges() const {
  return qxSync(*syncQueue_, [&] { return syncQueueHasUnwrittenChanges_; });
}

void DVAccessControlStore::writeUnwrittenChanges() {
  syncQueue_->sync([&] {
    if (syncQueueHasUnwrittenChanges_) syncQueueCommitAccessControl();
  });
}

bool DVAccessControlStore::allowWhereThereIsRoom(const DVGrant& grant, const DVGranter& granter) {
  return qxSync(*syncQueue_, [&] {
    const DVGrantTree& tree = *syncQueueAccessControlDict_;
    if (!tree.allows(grant.provider, grant.item, grant.consumer)) {
      if (!syncQueueLimits_.hasRoomFor(tree, grant, granter)) return false;
      syncQueueLimits_.noteAdded(grant, granter);
    }
    syncQueueAllow(grant);
    return true;
  });
}

void DVAccessControlStore::allowProviderWithIdentifier(const ProviderID& provider, const ItemID& toProvideItemID,
                                                       const ConsumerID& toConsumerWithIdentifier) {
  syncQueue_->sync([&] { syncQueueAllow({provider, toConsumerWithIdentifier, toProvideItemID}); });
}

void DVAccessControlStore::syncQueueAllow(const DVGrant& grant) {
  assert(syncQueue_->isCurrent());
  if (!syncQueueAccessControlDict_->allow(grant.provider, grant.item, grant.consumer)) {
    dvLog("[INFO] Provider ID %@ is already allowed to provide item ID “%@” to consumer ID %@.", grant.provider, grant.item,
          grant.consumer);
    return;
  }
  dvLog("[INFO] Allowing provider ID %@ to provide item ID “%@” to consumer ID %@", grant.provider, grant.item, grant.consumer);
  syncQueueCommitAccessControl();
}

void DVAccessControlStore::disallowProviderWithIdentifier(const ProviderID& provider, const ItemID& fromProvidingItemWithID,
                                                          const ConsumerID& toConsumerWithIdentifier) {
  syncQueue_->sync([&] {
    if (!syncQueueAccessControlDict_->disallow(provider, fromProvidingItemWithID, toConsumerWithIdentifier)) return;
    dvLog("[INFO] No longer allowing provider ID %@ to provide item ID “%@” to consumer ID %@", provider, fromProvidingItemWithID,
          toConsumerWithIdentifier);
    syncQueueLimits_.noteRemovals(*syncQueueAccessControlDict_);
    syncQueueCommitAccessControl();
  });
}

void DVAccessControlStore::rereadAccessControl() {
  syncQueue_->async([strongSelf = shared_from_this()] { strongSelf->syncQueueReadAccessControl(); });
}

void DVAccessControlStore::syncQueueReadAccessControl() {
  assert(weak_from_this().expired() || syncQueue_->isCurrent());  // the constructor reads before anybody else can
  QXPropertyLists& propertyLists = QXPlatform::current().propertyLists;
  if (QXPlatform::current().fileSystem.exists(accessControlFilePath())) {
    if (const auto stream = propertyLists.openStream(accessControlFilePath())) {
      auto [tree, error, isMisshapen] = interpreted(propertyLists.read(*stream));
      syncQueueAccessControlDict_ = std::move(tree);
      syncQueueFileIsMisshapen_ = isMisshapen;
      syncQueueHasUnwrittenChanges_ = false;
      if (error) {
        dvLog("[ERROR] Cannot read access control from disk. Error: %@", *error);
      } else {
        dvLog("[INFO] Successfully read access control from disk.");
      }
    }
  }
  if (!syncQueueAccessControlDict_) syncQueueAccessControlDict_.emplace();
  syncQueueLimits_.noteRemovals(*syncQueueAccessControlDict_);
}

void DVAccessControlStore::syncQueueCommitAccessControl() {
  assert(syncQueue_->isCurrent());
  dvLog("[INFO] Committing access control list");
  QXPropertyLists& propertyLists = QXPlatform::current().propertyLists;
  const std::string& path = accessControlFilePath();
  if (syncQueueFileIsMisshapen_ && (!QXPlatform::current().fileSystem.exists(path) || propertyLists.keepBeside(path))) {
    syncQueueFileIsMisshapen_ = false;
  }
  syncQueueHasUnwrittenChanges_ =
      syncQueueFileIsMisshapen_ || !propertyLists.writeXMLAtomically(syncQueueAccessControlDict_->dictionary(), path);
  if (syncQueueHasUnwrittenChanges_) dvLog("[ERROR] Could not write to %@", path);
}

}  // namespace docuvend
