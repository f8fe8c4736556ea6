// A pass goes over three queues:
//
//   refresh operations queue   start: suspend this queue, so that the next pass waits
//   concurrent queue           rebuild, as a barrier: no lookup sees a half-built registry, and a lookup that was asked for after the pass
//                              began sees the new one. Unregistrations are asked for here, before the new registry is in place
//   global queue               register the new providers, one after another, and at last resume the first queue
//
// New providers can be looked up before they are registered with file coordination; a provider whose registration fails stays.
#include "providers/DVRefreshPass.h"

#include <cassert>
#include <utility>

#include "common/DVLog.h"
#include "platform/QXPlatform.h"
#include "providers/DVProviderRegistry.h"
#include "providers/DVRefreshPlan.h"

namespace docuvend {

void DVRefreshPass::refreshOperationsQueueStart() {
  DVProviderRegistry& registry = DVProviderRegistry::shared();
  assert(registry.refreshOperationsQueue().isCurrent());
  registry.refreshOperationsQueue().suspend();
  dvLog("[INFO] Updating provider list.");
  registry.concurrentQueue().barrierAsync([strongSelf = shared_from_this()] { strongSelf->concurrentQueueRebuild(); });
}

void DVRefreshPass::concurrentQueueRebuild() {
  DVProviderRegistry& registry = DVProviderRegistry::shared();
  const DVProviderRegistry::Dictionary& present = registry.concurrentQueueProviders();

  std::map<ProviderID, std::shared_ptr<QXExtension>> registered;
  for (const auto& [identifier, provider] : present) registered.emplace(identifier, provider->extension());
  const DVRefreshPlan plan = dvPlanRefresh(std::move(registered), installed_);

  DVProviderRegistry::Dictionary renewed;
  for (std::size_t i = 0; i < installed_.size(); ++i) {
    const std::optional<ProviderID>& identifier = plan.steps[i].identifier;
    switch (plan.steps[i].action) {
      case DVRefreshPlan::Action::ignore:
        dvLog("[NOTICE] Docuvend extension %@ has no identifier. Ignoring.", installed_[i]);
        break;
      case DVRefreshPlan::Action::keep:
        renewed[*identifier] = present.at(*identifier);
        break;
      case DVRefreshPlan::Action::make:
        toRegister_.push_back(DVExtensionDocuvend::initWithExtension(installed_[i]));
        renewed[*identifier] = toRegister_.back();
        break;
    }
  }
  for (const ProviderID& identifier : plan.toUnregister) present.at(identifier)->unregisterFromFileCoordinator();
  if (present != renewed) registry.concurrentQueueSetProviders(std::move(renewed));
  QXPlatform::current().queues.globalQueue().async([strongSelf = shared_from_this()] { strongSelf->registerNewProviders(); });
}

void DVRefreshPass::registerNewProviders() {
  DVExtensionDocuvend::refreshOperationsQueueRegisterProviders(std::move(toRegister_),
                                                               [strongSelf = shared_from_this()] { strongSelf->end(); });
}

void DVRefreshPass::end() {
  DVProviderRegistry& registry = DVProviderRegistry::shared();
  registry.refreshOperationsQueue().resume();
  if (const DVExtensionDocuvend::Completion completion = registry.takePendingStartUpCompletion()) completion();
}

}  // namespace docuvend
