#include "platform/linux/identity/LinuxApplicationRegistry.h"

#include <map>
#include <utility>

#include "platform/linux/identity/ProcessReading.h"

namespace docuvend::linux_platform {

std::optional<std::string> LinuxApplicationRegistry::bundleIdentifierForAuditToken(const QXAuditToken& token) {
  if (token == QXAuditToken{}) return std::nullopt;
  const auto peer = peers_.find(token);
  if (!peer || !isAlive(peer->pidfd)) return std::nullopt;
  return peer->bundleIdentifier;
}

std::optional<QXApplicationRecord> LinuxApplicationRegistry::recordForIdentifier(const std::string& identifier) {
  auto bundle = bundles_.find(identifier);
  if (!bundle) return std::nullopt;
  std::map<std::string, QXURL, std::less<>> groupContainers;
  for (const auto& [group, directory] : bundle->groups) groupContainers.emplace(group, QXURL::fileURL(directory, QXURLKind::directory));
  return QXApplicationRecord(std::move(bundle->info), std::move(groupContainers));
}

}  // namespace docuvend::linux_platform
