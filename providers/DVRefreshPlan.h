// What a refresh pass does with the extensions that are installed now and the providers that are registered: a function of values.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <vector>

#include "platform/extension_host.h"
#include "platform/identifiers.h"

namespace docuvend {

struct DVRefreshPlan {
  enum class Action {
    ignore,  // the extension has no identifier
    keep,    // the provider of that identifier was made from this very extension
    make,    // a new provider, to be registered with file coordination
  };
  struct Step {
    Action action;
    std::optional<ProviderID> identifier;  // absent when ignored
    friend bool operator==(const Step&, const Step&) = default;
  };

  std::vector<Step> steps;               // one for each extension, in their order; of two for one identifier the later wins
  std::vector<ProviderID> toUnregister;  // providers whose extension vanished or was replaced

  friend bool operator==(const DVRefreshPlan&, const DVRefreshPlan&) = default;
};

// `registered` gives the extension from which each registered provider was made.
[[nodiscard]] DVRefreshPlan dvPlanRefresh(std::map<ProviderID, std::shared_ptr<QXExtension>> registered,
                                          const std::vector<std::shared_ptr<QXExtension>>& installed);

}  // namespace docuvend
