// A part of the access control list that one message carries.
//
// A page holds so few grants and so little text that it fits into a message with room to spare. A grant whose identifiers no message can
// carry is left out: nobody could make use of it, nor name it in order to revoke it; such a one comes about by an edit of the file alone.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

#include "acl/DVGrantTree.h"
#include "platform/QXValue.h"
#include "platform/identifiers.h"

namespace docuvend {

inline constexpr std::size_t kDVMaximumGrantsOfPage = 1000;
inline constexpr std::size_t kDVMaximumTextBytesOfPage = std::size_t{1} << 19U;  // of identifiers
inline constexpr std::size_t kDVLongestIdentifier = std::size_t{1} << 16U;       // bytes: the longest text that a message carries

// All that are of the provider and of the consumer, where these are given.
struct DVGrantFilter {
  std::optional<ProviderID> provider;
  std::optional<ConsumerID> consumer;

  [[nodiscard]] bool admits(const DVGrant& grant) const;
};

struct DVGrantPage {
  // Dictionaries of the strings "providerIdentifier", "consumerIdentifier" and "itemIdentifier".
  QXArray grants;
  // Where in the list the next page starts; none when there is none.
  std::optional<std::size_t> next;

  // From that position in the list on.
  [[nodiscard]] static DVGrantPage of(const std::vector<DVGrant>& list, const DVGrantFilter& filter, std::size_t start);
};

}  // namespace docuvend
