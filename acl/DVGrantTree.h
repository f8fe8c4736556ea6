// The access control list as a value: which provider may provide which of its items to which consumer.
//
// In memory it is what the file holds: provider identifier, then consumer identifier, then "AllowedItemIDs", an array of item identifiers
// in the order in which they were granted. Reading a tree and writing it unchanged loses nothing, also what no grant needs (an empty
// dictionary, an item listed twice, a further key beside "AllowedItemIDs").
#pragma once

#include <compare>
#include <cstdint>
#include <variant>
#include <vector>

#include "platform/QXError.h"
#include "platform/QXValue.h"
#include "platform/identifiers.h"

namespace docuvend {

// The domain and code of the one error that a list which is laid out wrongly makes.
inline constexpr const char* kDVGrantTreeErrorDomain = "DVGrantTreeErrorDomain";
inline constexpr std::int64_t kDVGrantTreeMisshapen = 1;

struct DVGrant {
  ProviderID provider;
  ConsumerID consumer;
  ItemID item;

  friend auto operator<=>(const DVGrant&, const DVGrant&) = default;
};

class DVGrantTree {
 public:
  // A tree without grants.
  DVGrantTree() = default;

  // The tree that a property list holds, or an error that says where its types are not those of a tree.
  [[nodiscard]] static std::variant<DVGrantTree, QXError> fromPropertyList(QXValue propertyList);

  [[nodiscard]] const QXDictionary& dictionary() const { return dictionary_; }

  // By provider and consumer, items in the order in which they were granted.
  [[nodiscard]] std::vector<DVGrant> grants() const;

  // Three look-ups and one linear search; identifiers are compared as exact strings.
  [[nodiscard]] bool allows(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer) const;

  // False when the grant is there already: nothing has changed then.
  [[nodiscard]] bool allow(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer);

  // Removes the grant, and with it every container that this leaves empty. False when there is no such grant: nothing has changed then.
  [[nodiscard]] bool disallow(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer);

  friend bool operator==(const DVGrantTree&, const DVGrantTree&) = default;

 private:
  explicit DVGrantTree(QXDictionary dictionary) : dictionary_(std::move(dictionary)) {}

  // A dictionary of dictionaries of dictionaries; every "AllowedItemIDs" in it is an array of strings.
  QXDictionary dictionary_;
};

}  // namespace docuvend
