// The process's access control list and its file, "Library/Docuvend/AccessControl.plist" under the home directory: the daemon's only
// persisted state.
//
// Every read and change of the list is one task on the store's serial queue, so a grant and its writing are one step to everybody else.
// Queries, grants and revocations block their caller until that task is done, and a change is on disk when the call returns; when it
// could not be written it is kept in memory, and the next change writes it too. None of them may be called from the store's own queue.
// Failures are logged here and nowhere else.
//
// A file that is a property list but no access control list is kept beside, under another name, before it is overwritten. When it cannot
// be kept nothing is written, as when writing fails.
#pragma once

#include <memory>
#include <optional>
#include <vector>

#include "acl/DVAccessControl.h"
#include "acl/DVGrantLimits.h"
#include "acl/DVGrantTree.h"
#include "platform/identifiers.h"
#include "platform/queue.h"

namespace docuvend {

class DVAccessControlStore final : public DVAccessControl, public std::enable_shared_from_this<DVAccessControlStore> {
 public:
  // The one store of the process. It is made, and its file read, by the first call; it is never destroyed.
  [[nodiscard]] static const std::shared_ptr<DVAccessControlStore>& sharedStore();

  // Reads the file on the calling thread. From then on the shared store rereads it on each first-unlock notification. A store belongs to
  // a shared_ptr.
  DVAccessControlStore();

  [[nodiscard]] const std::shared_ptr<QXQueue>& syncQueue() const { return syncQueue_; }

  // Empty identifiers are looked up like any other.
  [[nodiscard]] bool isProviderWithIdentifier(const std::optional<ProviderID>& provider,
                                              const std::optional<ItemID>& allowedToProvideItemID,
                                              const std::optional<ConsumerID>& toConsumerWithIdentifier) const override;
  // The question for identifiers that an untrusted text named: an empty provider or item identifier is refused like an absent one. An
  // empty consumer identifier is looked up.
  [[nodiscard]] bool isProviderIdentifier(const std::optional<ProviderID>& provider, const std::optional<ItemID>& allowedToProvideItemID,
                                          const std::optional<ConsumerID>& toConsumerWithIdentifier) const;

  // The whole list at one moment.
  [[nodiscard]] std::vector<DVGrant> grants() const;
  // The file says less or more than the list: the latest change could not be written.
  [[nodiscard]] bool hasUnwrittenChanges() const;
  // Writes the list once more if that is so.
  void writeUnwrittenChanges();

  // The same as `allow` for a grant that somebody else names, unless the list has no room for it (DVGrantLimits.h): then false, and
  // nothing is done. A grant that is there already needs no room.
  [[nodiscard]] bool allowWhereThereIsRoom(const DVGrant& grant, const DVGranter& granter);

  // These check nothing.
  void allowProviderWithIdentifier(const ProviderID& provider, const ItemID& toProvideItemID, const ConsumerID& toConsumerWithIdentifier);
  void disallowProviderWithIdentifier(const ProviderID& provider, const ItemID& fromProvidingItemWithID,
                                      const ConsumerID& toConsumerWithIdentifier);

  // Reads the file again, later, on the store's queue. A file that is gone leaves the list as it is; one that cannot be read empties it.
  void rereadAccessControl();

 private:
  void syncQueueAllow(const DVGrant& grant);
  void syncQueueReadAccessControl();
  void syncQueueCommitAccessControl();

  // Constant after construction.
  const std::shared_ptr<QXQueue> syncQueue_;

  // Only on syncQueue; by the constructor before that. Absent only while the file is being read.
  std::optional<DVGrantTree> syncQueueAccessControlDict_;
  DVGrantLimits syncQueueLimits_;
  // The file is a property list that is no access control list, and there is no copy of it yet: somebody's edit went wrong, and it is
  // not overwritten without one.
  bool syncQueueFileIsMisshapen_ = false;
  bool syncQueueHasUnwrittenChanges_ = false;
};

}  // namespace docuvend
