// Installed bundles and connected callers, as the daemon asks for them.
#pragma once

#include <optional>
#include <string>

#include "platform/application_registry.h"
#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/identity/PeerIdentity.h"

namespace docuvend::linux_platform {

// Creates no directory, and group containers need not exist. Both arguments outlive it. May be used from any thread.
class LinuxApplicationRegistry final : public QXApplicationRegistry {
 public:
  LinuxApplicationRegistry(BundleRegistry& bundles, PeerDirectory& peers) : bundles_(bundles), peers_(peers) {}

  [[nodiscard]] std::optional<std::string> bundleIdentifierForAuditToken(const QXAuditToken& token) override;
  [[nodiscard]] std::optional<QXApplicationRecord> recordForIdentifier(const std::string& identifier) override;

 private:
  BundleRegistry& bundles_;
  PeerDirectory& peers_;
};

}  // namespace docuvend::linux_platform
