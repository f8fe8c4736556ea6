#include <variant>

#include "common/DVLog.h"
#include "platform/QXPlatform.h"
#include "providers/DVExtensionDocuvend.h"
#include "providers/DVProviderRegistry.h"

namespace docuvend {
namespace {

enum class Verdict { owner, excluded, goOn };

void logMissingDirectory(const DVExtensionDocuvend& provider) {
  dvLog("[DEBUG] Docuvend %@ doesn't have a provided items directory; it may not have run so far.", provider.identifier());
}

bool saysThatDirectoryIsMissing(const QXError& error, const QXURL& directory) {
  return error.domain == kQXGeneralErrorDomain && error.code == kQXFileReadNoSuchFileError && error.url == directory;
}

Verdict judge(const DVExtensionDocuvend& provider, const QXURL& url) {
  const std::optional<QXURL> directory = provider.providedItemsURL();
  if (!directory) {
    logMissingDirectory(provider);
    return Verdict::goOn;
  }
  const std::variant<QXRelationship, QXError> answer = QXPlatform::current().fileSystem.relationship(*directory, url);
  if (const QXError* error = std::get_if<QXError>(&answer)) {
    if (saysThatDirectoryIsMissing(*error, *directory)) {
      logMissingDirectory(provider);
    } else {
      dvLog("[ERROR] Cannot get the relationship between URL %@ and %@. Error: %@", *directory, url, *error);
    }
    return Verdict::goOn;
  }
  switch (std::get<QXRelationship>(answer)) {
    case QXRelationship::same:
      dvLog("[DEBUG] Ignoring URLs that exactly match the document container folder");
      return Verdict::excluded;
    case QXRelationship::contains:
      dvLog("[INFO] Resolved URL to provider %@.", provider.identifier());
      return Verdict::owner;
    case QXRelationship::other:
      break;
  }
  return Verdict::goOn;
}

}  // namespace

// The first directory that answers decides. Directories of different providers are normally disjoint.
std::shared_ptr<DVExtensionDocuvend> DVExtensionDocuvend::providerForURL(const QXURL& url, bool* outExcludedURL) {
  std::shared_ptr<DVExtensionDocuvend> owner;
  bool excludedURL = false;
  DVProviderRegistry& registry = DVProviderRegistry::shared();
  registry.concurrentQueue().sync([&owner, &excludedURL, &registry, &url] {
    for (const auto& [identifier, provider] : registry.concurrentQueueProviders()) {
      const Verdict verdict = judge(*provider, url);
      if (verdict == Verdict::goOn) continue;
      if (verdict == Verdict::owner) owner = provider;
      excludedURL = verdict == Verdict::excluded;
      break;
    }
  });
  if (outExcludedURL != nullptr) *outExcludedURL = excludedURL;
  return owner;
}

std::shared_ptr<DVExtensionDocuvend> DVExtensionDocuvend::providerForURL(const QXURL& url) {
  return providerForURL(url, /*outExcludedURL=*/nullptr);
}

}  // namespace docuvend
