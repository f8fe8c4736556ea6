// What a grant may be, so that the list can always be written and nobody fills it.
//
// Who may write a document may pass it on to any name, and a provider calls its items as it likes: neither may keep the grants of others
// off the disk, with a name that no file can carry or with more names than a file may have; and the first may not use up the room of those
// who are entitled to grant. A list that exceeds a limit already, as one that was edited by hand, keeps what it has.
#pragma once

#include <cstddef>

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

// Who names the consumer: a holder of the entitlement to grant, or whoever may write the document.
enum class DVGranter { entitled, writer };

// Whether the tree may be given this grant, which it does not have yet.
[[nodiscard]] bool dvHasRoomFor(const DVGrantTree& tree, const DVGrant& grant, DVGranter granter);

}  // namespace docuvend
