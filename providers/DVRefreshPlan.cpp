#include "providers/DVRefreshPlan.h"

#include <utility>

namespace docuvend {

DVRefreshPlan dvPlanRefresh(std::map<ProviderID, std::shared_ptr<QXExtension>> registered,
                            const std::vector<std::shared_ptr<QXExtension>>& installed) {
  DVRefreshPlan plan;
  auto& leftovers = registered;
  for (const std::shared_ptr<QXExtension>& extension : installed) {
    std::optional<std::string> identifier = extension->identifier();
    if (!identifier) {
      plan.steps.push_back({DVRefreshPlan::Action::ignore, std::nullopt});
      continue;
    }
    ProviderID provider{std::move(*identifier)};
    const auto found = leftovers.find(provider);
    const bool isUnchanged = found != leftovers.end() && found->second->isEqual(*extension);
    if (isUnchanged) leftovers.erase(found);
    plan.steps.push_back({isUnchanged ? DVRefreshPlan::Action::keep : DVRefreshPlan::Action::make, std::move(provider)});
  }
  for (const auto& [provider, extension] : leftovers) plan.toUnregister.push_back(provider);
  return plan;
}

}  // namespace docuvend
