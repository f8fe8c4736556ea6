#include "providers/DVProviderRegistry.h"

#include <cassert>
#include <utility>

#include "platform/QXPlatform.h"

namespace docuvend {

DVProviderRegistry& DVProviderRegistry::shared() {
  static DVProviderRegistry& registry = *new DVProviderRegistry;
  return registry;
}

DVProviderRegistry::DVProviderRegistry()
    : concurrentQueue_(QXPlatform::current().queues.concurrentQueue("DVExtensionDocuvend concurrent queue")),
      refreshOperationsQueue_(QXPlatform::current().queues.serialQueue("DVExtensionDocuvend refresh operations queue")) {}

const DVProviderRegistry::Dictionary& DVProviderRegistry::concurrentQueueProviders() const {
  assert(concurrentQueue_->isCurrent());
  return concurrentQueueProviders_;
}

void DVProviderRegistry::concurrentQueueSetProviders(Dictionary providers) {
  assert(concurrentQueue_->isCurrent());
  concurrentQueueProviders_ = std::move(providers);
}

DVExtensionDocuvend::Completion DVProviderRegistry::takePendingStartUpCompletion() {
  if (startUpCompletionTaken_.test_and_set()) return {};
  return std::exchange(pendingStartUpCompletion_, {});
}

}  // namespace docuvend
