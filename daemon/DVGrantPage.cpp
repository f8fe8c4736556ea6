#include "daemon/DVGrantPage.h"

#include <algorithm>

namespace docuvend {
namespace {

static_assert(3 * kDVLongestIdentifier <= kDVMaximumTextBytesOfPage, "every page has room for one grant at least");

QXDictionary entryOf(const DVGrant& grant) {
  return {{"providerIdentifier", grant.provider.value}, {"consumerIdentifier", grant.consumer.value}, {"itemIdentifier", grant.item.value}};
}

bool isCarried(const DVGrant& grant) {
  return std::max({grant.provider.value.size(), grant.consumer.value.size(), grant.item.value.size()}) <= kDVLongestIdentifier;
}

std::size_t textBytes(const DVGrant& grant) { return grant.provider.value.size() + grant.consumer.value.size() + grant.item.value.size(); }

}  // namespace

bool DVGrantFilter::admits(const DVGrant& grant) const {
  return (!provider || *provider == grant.provider) && (!consumer || *consumer == grant.consumer);
}

DVGrantPage DVGrantPage::of(const std::vector<DVGrant>& list, const DVGrantFilter& filter, std::size_t start) {
  DVGrantPage page;
  std::size_t bytes = 0;
  for (std::size_t i = start; i < list.size(); ++i) {
    const DVGrant& grant = list[i];
    if (!filter.admits(grant) || !isCarried(grant)) continue;
    bytes += textBytes(grant);
    if (page.grants.size() == kDVMaximumGrantsOfPage || bytes > kDVMaximumTextBytesOfPage) {
      page.next = i;
      break;
    }
    page.grants.emplace_back(entryOf(grant));
  }
  return page;
}

}  // namespace docuvend
