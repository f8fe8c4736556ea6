#include <atomic>
#include <iterator>
#include <memory>
#include <utility>

#include "common/DVLog.h"
#include "platform/QXPlatform.h"
#include "platform/provider_extension.h"
#include "providers/DVExtensionDocuvend.h"
#include "providers/DVProviderRegistry.h"
#include "providers/DVRefreshPass.h"
#include "providers/_QXDocuvendExtensionHostContext.h"

namespace docuvend {
namespace {

constexpr std::int32_t kRegistrationTries = 3;
constexpr const char* kDocumentStorageURLKey = "documentStorageURL";
constexpr const char* kProviderIdentifierKey = "providerIdentifier";

void refresh(std::vector<std::shared_ptr<QXExtension>> extensions) {
  const auto pass = std::make_shared<DVRefreshPass>(std::move(extensions));
  DVProviderRegistry::shared().refreshOperationsQueue().async([pass] { pass->refreshOperationsQueueStart(); });
}

void startDiscovery(DVExtensionDocuvend::Completion completion) {
  DVProviderRegistry& registry = DVProviderRegistry::shared();
  registry.setPendingStartUpCompletion(std::move(completion));
  const QXExtensionContextClass contextClass{_QXDocuvendExtensionHostContext::_extensionAuxiliaryHostProtocol(),
                                             _QXDocuvendExtensionHostContext::_extensionAuxiliaryVendorProtocol()};
  registry.setMatch(QXPlatform::current().extensionHost.beginMatching(
      {{std::string(kQXExtensionPointName), std::string(kQXProviderExtensionPoint)}}, contextClass,
      [](std::vector<std::shared_ptr<QXExtension>> extensions, std::optional<QXError>) { refresh(std::move(extensions)); }));
}

// The list of values ends at the first that is absent, and nothing after it is entered.
QXDictionary infoOf(const DVExtensionDocuvend& provider) {
  QXDictionary info;
  std::optional<QXURL> url = provider._providedItemsURL();
  if (!url) return info;
  info.emplace(kDocumentStorageURLKey, std::move(*url));
  std::optional<std::string> identifier = provider._fileReactorID();
  if (!identifier) return info;
  info.emplace(kProviderIdentifierKey, std::move(*identifier));
  return info;
}

// One link of the chain of registrations: a provider's turn, and what comes after it. A registration may report more than once; the
// chain goes on at the first report, whatever it says.
class RegistrationTurn {
 public:
  RegistrationTurn(std::shared_ptr<DVExtensionDocuvend> provider, DVExtensionDocuvend::Providers rest,
                   DVExtensionDocuvend::Completion completion)
      : provider_(std::move(provider)), rest_(std::move(rest)), completion_(std::move(completion)) {}

  void registered(const std::optional<QXError>& error) {
    if (error) dvLog("[ERROR] Could not register docuvend %@. Error: %@", provider_->identifier(), error);
    if (hasGoneOn_.test_and_set()) return;
    DVExtensionDocuvend::refreshOperationsQueueRegisterProviders(rest_, completion_);
  }

 private:
  const std::shared_ptr<DVExtensionDocuvend> provider_;
  const DVExtensionDocuvend::Providers rest_;
  const DVExtensionDocuvend::Completion completion_;
  std::atomic_flag hasGoneOn_;
};

}  // namespace

void DVExtensionDocuvend::createInstancesCompletion(Completion completion) {
  const bool startedNow = DVProviderRegistry::shared().startDiscoveryOnce([&completion] { startDiscovery(completion); });
  if (completion && !startedNow) QXPlatform::current().queues.globalQueue().async(std::move(completion));
}

void DVExtensionDocuvend::refreshOperationsQueueRegisterProviders(Providers providers, Completion completion) {
  if (providers.empty()) {
    if (completion) QXPlatform::current().queues.globalQueue().async(std::move(completion));
    return;
  }
  const std::shared_ptr<DVExtensionDocuvend> provider = providers.front();
  const auto turn =
      std::make_shared<RegistrationTurn>(provider, Providers(std::next(providers.begin()), providers.end()), std::move(completion));
  provider->registerWithFileCoordinatorRetryCount(kRegistrationTries, [turn](std::optional<QXError> error) { turn->registered(error); });
}

std::shared_ptr<DVExtensionDocuvend> DVExtensionDocuvend::providerWithIdentifier(const ProviderID& identifier) {
  DVProviderRegistry& registry = DVProviderRegistry::shared();
  return qxSync(registry.concurrentQueue(), [&registry, &identifier]() -> std::shared_ptr<DVExtensionDocuvend> {
    const DVProviderRegistry::Dictionary& providers = registry.concurrentQueueProviders();
    const auto found = providers.find(identifier);
    return found == providers.end() ? nullptr : found->second;
  });
}

QXDictionary DVExtensionDocuvend::providersInfo() {
  DVProviderRegistry& registry = DVProviderRegistry::shared();
  return qxSync(registry.concurrentQueue(), [&registry] {
    QXDictionary infos;
    for (const auto& [identifier, provider] : registry.concurrentQueueProviders()) infos.emplace(identifier.value, infoOf(*provider));
    return infos;
  });
}

}  // namespace docuvend
