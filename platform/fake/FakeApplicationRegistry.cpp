#include "platform/fake/FakeApplicationRegistry.h"

#include <utility>

namespace docuvend::fake_platform {

std::optional<std::string> FakeApplicationRegistry::bundleIdentifierForAuditToken(const QXAuditToken& token) {
  const std::lock_guard lock(mutex_);
  ++tokenQueries_;
  const auto found = bundleIdentifiers_.find(token);
  if (found == bundleIdentifiers_.end()) return std::nullopt;
  return found->second;
}

std::optional<QXApplicationRecord> FakeApplicationRegistry::recordForIdentifier(const std::string& identifier) {
  const std::lock_guard lock(mutex_);
  ++recordQueries_;
  const auto found = records_.find(identifier);
  if (found == records_.end()) return std::nullopt;
  return found->second;
}

void FakeApplicationRegistry::setRecord(const std::string& identifier, QXDictionary infoPlist, GroupContainers groupContainers) {
  const std::lock_guard lock(mutex_);
  records_.insert_or_assign(identifier, QXApplicationRecord(std::move(infoPlist), std::move(groupContainers)));
}

void FakeApplicationRegistry::setProviderRecord(const std::string& identifier, const std::string& group, const std::string& containerPath) {
  QXDictionary extension;
  extension.emplace("QXExtensionPointName", "com.orvane.docuvend-nonui");
  extension.emplace("QXExtensionDocuvendDocumentGroup", group);
  QXDictionary infoPlist;
  infoPlist.emplace("QXBundleIdentifier", identifier);
  infoPlist.emplace("QXExtension", std::move(extension));
  setRecord(identifier, std::move(infoPlist), {{group, QXURL::fileURL(containerPath, QXURLKind::directory)}});
}

void FakeApplicationRegistry::removeRecord(const std::string& identifier) {
  const std::lock_guard lock(mutex_);
  records_.erase(identifier);
}

void FakeApplicationRegistry::setBundleIdentifier(const QXAuditToken& token, std::string bundleIdentifier) {
  const std::lock_guard lock(mutex_);
  bundleIdentifiers_.insert_or_assign(token, std::move(bundleIdentifier));
}

void FakeApplicationRegistry::removeBundleIdentifier(const QXAuditToken& token) {
  const std::lock_guard lock(mutex_);
  bundleIdentifiers_.erase(token);
}

int FakeApplicationRegistry::recordQueryCount() const {
  const std::lock_guard lock(mutex_);
  return recordQueries_;
}

int FakeApplicationRegistry::tokenQueryCount() const {
  const std::lock_guard lock(mutex_);
  return tokenQueries_;
}

QXAuditToken FakeApplicationRegistry::token(std::uint8_t number) {
  QXAuditToken result;
  result.bytes.back() = number;
  return result;
}

}  // namespace docuvend::fake_platform
