// What confined processes may open, on Linux: tokens, their redemption, and what they may reach.
//
// Of a token that was issued nothing is remembered but the number that it may not be below, if some were taken back; what was redeemed for
// writing is remembered for the access query, until the next time that tokens are taken back. May be used from any thread.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "platform/linux/base/Paths.h"
#include "platform/linux/sandbox/AccessQuery.h"
#include "platform/linux/sandbox/DiskWork.h"
#include "platform/linux/sandbox/GroupContainers.h"
#include "platform/linux/sandbox/RedemptionLedger.h"
#include "platform/linux/sandbox/TokenPlaces.h"
#include "platform/linux/sandbox/TokenRedeemer.h"
#include "platform/linux/sandbox/TokenSession.h"
#include "platform/sandbox.h"

namespace docuvend::linux_platform {

class LinuxSandbox final : public QXSandbox {
 public:
  using Completion = std::function<void(std::optional<QXError>)>;
  using FileCompletion = std::function<void(std::variant<UniqueDescriptor, QXError>)>;

  // With the session that `paths` has. The registry and the directory outlive it. std::system_error when there is no thread for it.
  [[nodiscard]] static std::variant<std::unique_ptr<LinuxSandbox>, QXError> create(const Paths& paths, BundleRegistry& registry,
                                                                                   PeerDirectory& peers, QXLogHandle& log);
  LinuxSandbox(std::unique_ptr<TokenSession> session, BundleRegistry& registry, PeerDirectory& peers);

  std::optional<std::string> issueReadWriteExtension(const std::string& path) override;
  std::optional<QXError> invalidateReadWriteExtensions(const std::optional<std::string>& directory) override;
  int checkWithoutReport(const QXAuditToken& token, std::string_view operation, const std::string& path) override;

  // What is installed has changed: what was issued for a container that a bundle has left is taken back. Contract as above, but that
  // what such a token began before may still be under way: that is waited for by the other one, in bounded time.
  [[nodiscard]] std::optional<QXError> followInstalledBundles() { return places_.follow(); }
  void settleInstalledBundles() { places_.settle(); }

  // The same, with the reason.
  [[nodiscard]] AccessVerdict ask(const QXAuditToken& token, std::string_view operation, const std::string& path) const;

  // Whether the process may perform the operation on the path by itself, or brings a token that is good now for exactly this file. Like a
  // redemption, that takes one of this user's processes; nothing is remembered of it.
  [[nodiscard]] bool mayReach(const QXAuditToken& caller, std::string_view operation, const std::string& path,
                              const std::optional<std::string>& token) const;

  // Both are for the process that the audit token identifies, which must be one of this user's: confined or not, what it brings is what
  // counts. What may have to wait for the disk, or for others who write, is done on a thread for that; of one bundle one after another, in
  // the order in which it was asked for, whether or not the caller is still there, and not any more once this object goes.

  // The completion is called before this returns when there is nothing to wait for, as for a file that is there.
  void redeem(const QXAuditToken& caller, std::string token, TokenUse use, FileCompletion completion);
  // The completion is called before this returns when the caller or a token is refused.
  void replaceItem(const QXAuditToken& caller, std::string itemToken, std::string siblingToken, Completion completion);

 private:
  [[nodiscard]] std::shared_ptr<const PeerIdentity> somebody(const QXAuditToken& caller) const;
  // What was redeemed, remembered.
  [[nodiscard]] std::variant<UniqueDescriptor, QXError> entered(const std::string& instance, TokenUse use,
                                                                TokenRedeemer::Redeemed redeemed);
  [[nodiscard]] std::optional<QXError> replaceItemNow(const std::string& instance, const std::string& itemToken,
                                                      const std::string& siblingToken);

  const std::unique_ptr<TokenSession> session_;
  PeerDirectory& peers_;
  TokenPlaces places_;  // before the containers: TokenPlaces.cpp says why
  GroupContainers containers_;
  RedemptionLedger ledger_;
  const TokenRedeemer redeemer_;
  const AccessQuery query_;
  DiskWork diskWork_;  // the last, since its work uses the others
};

}  // namespace docuvend::linux_platform
