#include "acl/DVGrantTree.h"

#include <algorithm>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace docuvend {
namespace {

constexpr std::string_view kAllowedItemIDs = "AllowedItemIDs";

QXError misshapen(std::string place, std::string_view due) {
  return QXError::make(kDVGrantTreeErrorDomain, kDVGrantTreeMisshapen,
                       "The access control list is not laid out as one: " + std::move(place) + " is not " + std::string(due) + ".");
}

std::optional<QXError> problemWithConsumer(const std::string& place, const QXValue& value) {
  const auto* consumer = value.as<QXDictionary>();
  if (consumer == nullptr) return misshapen(place, "a dictionary");
  const auto found = consumer->find(kAllowedItemIDs);
  if (found == consumer->end()) return std::nullopt;
  const auto* items = found->second.as<QXArray>();
  const bool isArrayOfStrings =
      items != nullptr && std::all_of(items->begin(), items->end(), [](const QXValue& item) { return item.kind() == QXValueKind::string; });
  if (!isArrayOfStrings) return misshapen(place + ", " + std::string(kAllowedItemIDs), "an array of strings");
  return std::nullopt;
}

std::optional<QXError> problemWithProvider(const std::string& place, const QXValue& value) {
  const auto* provider = value.as<QXDictionary>();
  if (provider == nullptr) return misshapen(place, "a dictionary");
  for (const auto& [consumerID, consumer] : *provider) {
    if (auto problem = problemWithConsumer(std::string(place).append(", consumer ").append(consumerID), consumer)) return problem;
  }
  return std::nullopt;
}

template <class Container>
Container& entry(QXDictionary& dictionary, std::string_view key) {
  auto found = dictionary.find(key);
  if (found == dictionary.end()) found = dictionary.emplace(std::string(key), Container{}).first;
  return *found->second.as<Container>();
}

bool contains(const QXArray& items, const ItemID& item) {
  return std::any_of(items.begin(), items.end(), [&item](const QXValue& value) { return *value.as<std::string>() == item.value; });
}

}  // namespace

std::variant<DVGrantTree, QXError> DVGrantTree::fromPropertyList(QXValue propertyList) {
  auto* providers = propertyList.as<QXDictionary>();
  if (providers == nullptr) return misshapen("the top level", "a dictionary");
  for (const auto& [providerID, provider] : *providers) {
    if (auto problem = problemWithProvider("provider " + providerID, provider)) return *std::move(problem);
  }
  return DVGrantTree(std::move(*providers));
}

std::vector<DVGrant> DVGrantTree::grants() const {
  std::vector<DVGrant> grants;
  for (const auto& [provider, consumers] : dictionary_) {
    for (const auto& [consumer, entries] : *consumers.as<QXDictionary>()) {
      const auto* items = qxFind<QXArray>(*entries.as<QXDictionary>(), kAllowedItemIDs);
      if (items == nullptr) continue;
      for (const QXValue& item : *items) grants.push_back({ProviderID{provider}, ConsumerID{consumer}, ItemID{*item.as<std::string>()}});
    }
  }
  return grants;
}

bool DVGrantTree::allows(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer) const {
  const auto* consumers = qxFind<QXDictionary>(dictionary_, provider.value);
  if (consumers == nullptr) return false;
  const auto* grants = qxFind<QXDictionary>(*consumers, consumer.value);
  if (grants == nullptr) return false;
  const auto* items = qxFind<QXArray>(*grants, kAllowedItemIDs);
  return items != nullptr && contains(*items, item);
}

bool DVGrantTree::allow(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer) {
  auto& consumers = entry<QXDictionary>(dictionary_, provider.value);
  auto& grants = entry<QXDictionary>(consumers, consumer.value);
  auto& items = entry<QXArray>(grants, kAllowedItemIDs);
  if (contains(items, item)) return false;
  items.emplace_back(item.value);
  return true;
}

bool DVGrantTree::disallow(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer) {
  if (!allows(provider, item, consumer)) return false;
  auto& consumers = entry<QXDictionary>(dictionary_, provider.value);
  auto& grants = entry<QXDictionary>(consumers, consumer.value);
  auto& items = entry<QXArray>(grants, kAllowedItemIDs);

  std::erase(items, QXValue(item.value));
  if (!items.empty()) return true;
  grants.erase(std::string(kAllowedItemIDs));
  if (!grants.empty()) return true;
  consumers.erase(consumer.value);
  if (!consumers.empty()) return true;
  dictionary_.erase(provider.value);
  return true;
}

}  // namespace docuvend
