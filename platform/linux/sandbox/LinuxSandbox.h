// What confined processes may open, on Linux: tokens, their redemption, and the write query.
//
// Nothing is remembered of a token that was issued; what was redeemed for writing is, for the write query. May be used from any thread.
#pragma once

#include <memory>
#include <optional>
#include <shared_mutex>
#include <string>
#include <string_view>
#include <variant>

#include "platform/linux/base/Paths.h"
#include "platform/linux/sandbox/GroupContainers.h"
#include "platform/linux/sandbox/RedemptionLedger.h"
#include "platform/linux/sandbox/TokenKey.h"
#include "platform/linux/sandbox/TokenRedeemer.h"
#include "platform/linux/sandbox/WriteQuery.h"
#include "platform/sandbox.h"

namespace docuvend::linux_platform {

class LinuxSandbox final : public QXSandbox {
 public:
  // With the session's key from `paths.tokenKey`, whose directory exists. The registry and the directory outlive it.
  [[nodiscard]] static std::variant<std::unique_ptr<LinuxSandbox>, QXError> create(const Paths& paths, BundleRegistry& registry,
                                                                                   PeerDirectory& peers);
  // The key is kept in that file.
  LinuxSandbox(TokenKey key, std::string keyFile, BundleRegistry& registry, PeerDirectory& peers);

  std::optional<std::string> issueReadWriteExtension(const std::string& path) override;
  std::optional<QXError> invalidateReadWriteExtensions(const std::optional<std::string>& directory) override;
  int checkWithoutReport(const QXAuditToken& token, std::string_view operation, const std::string& path) override;

  // The same, with the reason.
  [[nodiscard]] std::variant<std::string, PathRefusal> issue(const std::string& path);
  [[nodiscard]] WriteVerdict mayWrite(const QXAuditToken& token, std::string_view operation, const std::string& path) const;

  // For the process that the audit token identifies, which must be one of this user's: confined or not, what it brings is what counts.
  [[nodiscard]] std::variant<UniqueDescriptor, QXError> redeem(const QXAuditToken& caller, std::string_view token, TokenUse use);
  [[nodiscard]] std::optional<QXError> replaceItem(const QXAuditToken& caller, std::string_view itemToken, std::string_view siblingToken);

 private:
  [[nodiscard]] std::shared_ptr<const PeerIdentity> somebody(const QXAuditToken& caller) const;

  const std::string keyFile_;
  std::shared_mutex keyMutex_;
  TokenKey key_;  // guarded by keyMutex_
  PeerDirectory& peers_;
  GroupContainers containers_;
  RedemptionLedger ledger_;
  const TokenRedeemer redeemer_;
  const WriteQuery query_;
};

}  // namespace docuvend::linux_platform
