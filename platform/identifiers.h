// The three identifiers that the system moves about, as types of their own so that none is taken for another. On the wire and in
// files each is the plain string; they compare as exact strings and may be empty.
#pragma once

#include <compare>
#include <string>

namespace docuvend {

struct ProviderID {  // the bundle identifier of a provider extension
  std::string value;
  friend auto operator<=>(const ProviderID&, const ProviderID&) = default;
};

struct ItemID {  // opaque, chosen by the provider for one of its items
  std::string value;
  friend auto operator<=>(const ItemID&, const ItemID&) = default;
};

struct ConsumerID {  // the bundle identifier of a consumer application
  std::string value;
  friend auto operator<=>(const ConsumerID&, const ConsumerID&) = default;
};

}  // namespace docuvend
