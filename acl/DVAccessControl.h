// Whether a provider may provide an item to a consumer.
#pragma once

#include <optional>

#include "platform/identifiers.h"

namespace docuvend {

class DVAccessControl {
 public:
  DVAccessControl() = default;
  DVAccessControl(const DVAccessControl&) = delete;
  DVAccessControl& operator=(const DVAccessControl&) = delete;
  virtual ~DVAccessControl() = default;

  // False when any of the three is absent. May be called from any thread.
  [[nodiscard]] virtual bool isProviderWithIdentifier(const std::optional<ProviderID>& provider,
                                                      const std::optional<ItemID>& allowedToProvideItemID,
                                                      const std::optional<ConsumerID>& toConsumerWithIdentifier) const = 0;
};

}  // namespace docuvend
