#include "providers/DVExtensionDocuvend.h"

#include <cassert>
#include <utility>

#include "common/DVLog.h"
#include "platform/QXPlatform.h"
#include "platform/provider_extension.h"

namespace docuvend {
namespace {

std::optional<QXURL> providedItemsURLOf(const std::shared_ptr<QXExtension>& extension, const std::optional<ProviderID>& identifier) {
  std::optional<QXApplicationRecord> record;
  if (identifier) record = QXPlatform::current().applicationRegistry.recordForIdentifier(identifier->value);
  if (!record) {
    dvLog("[ERROR] Cannot instantiate a Bundlery proxy for %@", extension);
    return std::nullopt;
  }
  const QXDictionary* dictionary = record->infoDictionaryForKey(kQXExtensionDictionaryKey);
  if (dictionary == nullptr) {
    dvLog("[ERROR] Cannot read QXExtension dictionary from the Info.plist of %@", extension);
    return std::nullopt;
  }
  const std::string* group = qxFind<std::string>(*dictionary, kQXProviderDocumentGroupKey);
  if (group == nullptr) {
    dvLog("[ERROR] Cannot read QXExtensionDocuvendDocumentGroup key from the Info.plist of %@", extension);
    return std::nullopt;
  }
  const auto container = record->groupContainers().find(*group);
  if (container == record->groupContainers().end()) {
    dvLog("[ERROR] Cannot deduce the provided items URL for %@", extension);
    return std::nullopt;
  }
  return container->second.appendingPathComponent(kQXProvidedItemsDirectoryName, QXURLKind::directory);
}

std::optional<ProviderID> identifierOf(const QXExtension& extension) {
  std::optional<std::string> identifier = extension.identifier();
  if (!identifier) return std::nullopt;
  return ProviderID{std::move(*identifier)};
}

}  // namespace

std::shared_ptr<DVExtensionDocuvend> DVExtensionDocuvend::initWithExtension(std::shared_ptr<QXExtension> extension) {
  assert(extension != nullptr);
  return std::shared_ptr<DVExtensionDocuvend>(new DVExtensionDocuvend(std::move(extension)));
}

DVExtensionDocuvend::DVExtensionDocuvend(std::shared_ptr<QXExtension> extension) {
  QXQueueService& queues = QXPlatform::current().queues;
  const std::optional<ProviderID> identifier = identifierOf(*extension);
  operationQueue_ = queues.operationQueue();
  operationQueue_->setName("Operation queue for " + qxDescribe(identifier));
  memberQueue_ = queues.concurrentQueue("DVExtensionDocuvend concurrent member queue for " + qxDescribe(identifier));
  memberQueueExtension_ = std::move(extension);
  memberQueueIdentifier_ = identifier;
  memberQueueProvidedItemsURL_ = providedItemsURLOf(memberQueueExtension_, identifier);
}

std::shared_ptr<QXExtension> DVExtensionDocuvend::extension() const {
  return qxSync(*memberQueue_, [this] { return memberQueueExtension_; });
}

void DVExtensionDocuvend::setExtension(std::shared_ptr<QXExtension> extension) {
  assert(extension != nullptr);
  memberQueue_->barrierAsync(
      [strongSelf = shared_from_this(), extension = std::move(extension)] { strongSelf->memberQueueExtension_ = extension; });
}

std::optional<ProviderID> DVExtensionDocuvend::identifier() const {
  return qxSync(*memberQueue_, [this] { return memberQueueIdentifier_ ? memberQueueIdentifier_ : identifierOf(*memberQueueExtension_); });
}

void DVExtensionDocuvend::setIdentifier(std::optional<ProviderID> identifier) {
  memberQueue_->barrierAsync(
      [strongSelf = shared_from_this(), identifier = std::move(identifier)] { strongSelf->memberQueueIdentifier_ = identifier; });
}

std::optional<QXURL> DVExtensionDocuvend::providedItemsURL() const {
  return qxSync(*memberQueue_, [this] { return memberQueueProvidedItemsURL_; });
}

void DVExtensionDocuvend::setProvidedItemsURL(std::optional<QXURL> url) {
  memberQueue_->barrierAsync([strongSelf = shared_from_this(), url = std::move(url)] { strongSelf->memberQueueProvidedItemsURL_ = url; });
}

std::optional<QXURL> DVExtensionDocuvend::_providedItemsURL() const { return providedItemsURL(); }

std::shared_ptr<QXOperationQueue> DVExtensionDocuvend::_providedItemsOperationQueue() const { return operationQueue_; }

std::optional<std::string> DVExtensionDocuvend::_fileReactorID() const {
  std::optional<ProviderID> provider = identifier();
  if (!provider) return std::nullopt;
  return std::move(provider->value);
}

}  // namespace docuvend
