// What a grant may be, so that the list can always be written and nobody fills it.
//
// Who may write a document may pass it on to any name, and a provider calls its items as it likes: neither may keep the grants of others
// off the disk, with a name that no file can carry or with more names than a file may have; and the first may use up neither the room of
// those who are entitled to grant nor that of others who may write. A list that exceeds a limit already, as one that was edited by hand,
// keeps what it has.
#pragma once

#include <cstddef>
#include <map>
#include <optional>
#include <utility>

#include "acl/DVGrantTree.h"

namespace docuvend {

// Bytes of a consumer's and of an item's identifier.
inline constexpr std::size_t kDVLongestGrantedConsumerID = 255;
inline constexpr std::size_t kDVLongestGrantedItemID = 4096;
inline constexpr std::size_t kDVMaximumConsumersOfItem = 64;
// Of what the file says of one provider, counted as DVGrantLimits.cpp does. It leaves room for eight providers that take all they can.
inline constexpr std::size_t kDVMaximumBytesOfProvider = std::size_t{1} << 20U;
// What of both is kept for those who are entitled to grant.
inline constexpr std::size_t kDVConsumersKeptForEntitled = kDVMaximumConsumersOfItem / 2;
inline constexpr std::size_t kDVBytesKeptForEntitled = kDVMaximumBytesOfProvider / 2;

// Who names the consumer: a holder of the entitlement to grant, or whoever may write the document, by its bundle identifier.
class DVGranter {
 public:
  [[nodiscard]] static DVGranter entitled() { return DVGranter(std::nullopt); }
  [[nodiscard]] static DVGranter writer(ConsumerID bundle) { return DVGranter(std::move(bundle)); }

  // None: entitled.
  [[nodiscard]] const std::optional<ConsumerID>& writingBundle() const { return writingBundle_; }

 private:
  explicit DVGranter(std::optional<ConsumerID> writingBundle) : writingBundle_(std::move(writingBundle)) {}

  std::optional<ConsumerID> writingBundle_;
};

// The limits of one tree. A value that remembers which writer has added which grant, since the file does not say it: a writer may add one
// as long as what it has added takes no more than what is then left. So the first to take all it can leaves half, the next one half of
// that, and there is room for whoever has added nothing. What was added before this was made counts for nobody.
class DVGrantLimits {
 public:
  // Whether the tree may be given this grant, which it does not have yet.
  [[nodiscard]] bool hasRoomFor(const DVGrantTree& tree, const DVGrant& grant, const DVGranter& granter) const;

  // The tree has been given it.
  void noteAdded(const DVGrant& grant, const DVGranter& granter);
  // Grants have gone from the tree: what is remembered is never more than it has.
  void noteRemovals(const DVGrantTree& tree);

 private:
  [[nodiscard]] bool isOf(const ConsumerID& writer, const DVGrant& grant) const;

  std::map<DVGrant, ConsumerID> writers_;  // the bundles that have added these
};

}  // namespace docuvend
