// A provider's share is counted in bytes of the file, with a fixed part for each consumer and each item that is no less than the lines
// around it and no less than 32 bytes for each element of the property list. So the limits of the file, 16 MiB and 262,144 elements, are
// both kept by the one share.
#include "acl/DVGrantLimits.h"

#include <algorithm>
#include <set>
#include <string>
#include <string_view>

#include "platform/xml_text.h"

namespace docuvend {
namespace {

constexpr std::size_t kBytesAroundConsumer = 160;  // four elements
constexpr std::size_t kBytesAroundItem = 32;       // one
constexpr std::size_t kBytesOfEscape = 5;          // "&amp;" and "&#13;"

std::size_t bytesOf(std::string_view text) {
  const auto isEscaped = [](char c) { return c == '&' || c == '<' || c == '>' || c == '\r'; };
  const auto escaped = static_cast<std::size_t>(std::count_if(text.begin(), text.end(), isEscaped));
  return text.size() + escaped * (kBytesOfEscape - 1);
}

// What the grants of one provider take, the consumers counted once.
class Share {
 public:
  void add(const DVGrant& grant) {
    bytes_ += bytesOf(grant.item.value) + kBytesAroundItem;
    if (consumers_.insert(grant.consumer.value).second) bytes_ += bytesOf(grant.consumer.value) + kBytesAroundConsumer;
  }
  [[nodiscard]] std::size_t bytes() const { return bytes_; }

 private:
  std::set<std::string> consumers_;
  std::size_t bytes_ = 0;
};

}  // namespace

bool dvHasRoomFor(const DVGrantTree& tree, const DVGrant& grant, DVGranter granter) {
  if (grant.consumer.value.size() > kDVLongestGrantedConsumerID || grant.item.value.size() > kDVLongestGrantedItemID) return false;
  if (!qxIsXMLText(grant.provider.value) || !qxIsXMLText(grant.consumer.value) || !qxIsXMLText(grant.item.value)) return false;

  Share share;
  share.add(grant);
  std::size_t consumersOfItem = 1;
  for (const DVGrant& other : tree.grants()) {
    if (other.provider != grant.provider) continue;
    share.add(other);
    if (other.item == grant.item) ++consumersOfItem;
  }
  const bool isEntitled = granter == DVGranter::entitled;
  return share.bytes() <= kDVMaximumBytesOfProvider - (isEntitled ? 0 : kDVBytesKeptForEntitled) &&
         consumersOfItem <= kDVMaximumConsumersOfItem - (isEntitled ? 0 : kDVConsumersKeptForEntitled);
}

}  // namespace docuvend
