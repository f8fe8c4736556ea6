// A provider's share is counted in bytes of the file, with a fixed part for each consumer and each item that is no less than the lines
// around it and no less than 32 bytes for each element of the property list. So the limits of the file, 16 MiB and 262,144 elements, are
// both kept by the one share.
#include "acl/DVGrantLimits.h"

#include <algorithm>
#include <set>
#include <string>
#include <string_view>
#include <utility>

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

bool DVGrantLimits::hasRoomFor(const DVGrantTree& tree, const DVGrant& grant, const DVGranter& granter) const {
  if (grant.consumer.value.size() > kDVLongestGrantedConsumerID || grant.item.value.size() > kDVLongestGrantedItemID) return false;
  if (!qxIsXMLText(grant.provider.value) || !qxIsXMLText(grant.consumer.value) || !qxIsXMLText(grant.item.value)) return false;

  const auto& writer = granter.writingBundle();
  Share share;
  Share own;  // of that a writer's
  share.add(grant);
  std::size_t consumersOfItem = 1;
  std::size_t ownConsumersOfItem = 0;
  for (const DVGrant& other : tree.grants()) {
    if (other.provider != grant.provider) continue;
    share.add(other);
    if (other.item == grant.item) ++consumersOfItem;
    if (!writer || !isOf(*writer, other)) continue;
    own.add(other);
    if (other.item == grant.item) ++ownConsumersOfItem;
  }
  return share.bytes() + own.bytes() <= kDVMaximumBytesOfProvider - (writer ? kDVBytesKeptForEntitled : 0) &&
         consumersOfItem + ownConsumersOfItem <= kDVMaximumConsumersOfItem - (writer ? kDVConsumersKeptForEntitled : 0);
}

void DVGrantLimits::noteAdded(const DVGrant& grant, const DVGranter& granter) {
  if (const auto& writer = granter.writingBundle()) writers_.insert_or_assign(grant, *writer);
}

void DVGrantLimits::noteRemovals(const DVGrantTree& tree) {
  std::map<DVGrant, ConsumerID> left;
  for (const DVGrant& grant : tree.grants()) {
    const auto known = writers_.find(grant);
    if (known != writers_.end()) left.insert(*known);
  }
  writers_ = std::move(left);
}

bool DVGrantLimits::isOf(const ConsumerID& writer, const DVGrant& grant) const {
  const auto known = writers_.find(grant);
  return known != writers_.end() && known->second == writer;
}

}  // namespace docuvend
