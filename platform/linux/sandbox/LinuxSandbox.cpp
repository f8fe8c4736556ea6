#include "platform/linux/sandbox/LinuxSandbox.h"

#include <unistd.h>

#include <cerrno>

#include "platform/linux/sandbox/SandboxErrors.h"
#include "platform/linux/sandbox/SandboxToken.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kAllowed = 0;

int codeFor(WriteVerdict verdict) {
  switch (verdict) {
    case WriteVerdict::allowedByAccess:
    case WriteVerdict::allowedByRedemption:
      return kAllowed;
    case WriteVerdict::nobody:
    case WriteVerdict::outsideProfile:
      return EPERM;
    case WriteVerdict::unknownOperation:
      return ENOSYS;
    case WriteVerdict::peerGone:
      return ESRCH;
    case WriteVerdict::malformedPath:
      return EINVAL;
    case WriteVerdict::notFound:
    case WriteVerdict::anotherObject:
      return ENOENT;
    case WriteVerdict::accessDenied:
      return EACCES;
  }
  return EPERM;
}

QXError nobodyError() { return sandboxError(SandboxErrorCode::notPermitted, "the caller is not known"); }

}  // namespace

std::variant<std::unique_ptr<LinuxSandbox>, QXError> LinuxSandbox::create(const Paths& paths, BundleRegistry& registry,
                                                                          PeerDirectory& peers) {
  auto key = TokenKey::loadOrCreate(paths.tokenKey);
  if (auto* error = std::get_if<QXError>(&key)) return std::move(*error);
  return std::make_unique<LinuxSandbox>(std::get<TokenKey>(key), paths.tokenKey, registry, peers);
}

LinuxSandbox::LinuxSandbox(TokenKey key, std::string keyFile, BundleRegistry& registry, PeerDirectory& peers)
    : keyFile_(std::move(keyFile)),
      key_(std::move(key)),
      peers_(peers),
      containers_(registry),
      redeemer_(key_, containers_),
      query_(registry, peers, ledger_) {}

std::optional<std::string> LinuxSandbox::issueReadWriteExtension(const std::string& path) {
  auto issued = issue(path);
  if (auto* token = std::get_if<std::string>(&issued)) return std::move(*token);
  return std::nullopt;
}

std::variant<std::string, PathRefusal> LinuxSandbox::issue(const std::string& path) {
  const auto place = containers_.place(path);
  if (const auto* refusal = std::get_if<PathRefusal>(&place)) return *refusal;
  const std::shared_lock lock(keyMutex_);
  return SandboxToken{TokenKind::readWrite, std::get<PlacedItem>(place).path, SandboxToken::freshNonce()}.sealed(key_);
}

// A new key makes the tokens for all files worthless, those below the directory among them.
std::optional<QXError> LinuxSandbox::invalidateReadWriteExtensions(const std::optional<std::string>& /*directory*/) {
  const std::lock_guard lock(keyMutex_);
  auto renewed = TokenKey::renew(keyFile_);
  if (auto* error = std::get_if<QXError>(&renewed)) {
    key_ = TokenKey::random();
    return std::move(*error);
  }
  key_ = std::get<TokenKey>(renewed);
  return std::nullopt;
}

int LinuxSandbox::checkWithoutReport(const QXAuditToken& token, std::string_view operation, const std::string& path) {
  return codeFor(mayWrite(token, operation, path));
}

WriteVerdict LinuxSandbox::mayWrite(const QXAuditToken& token, std::string_view operation, const std::string& path) const {
  return query_.ask(token, operation, path);
}

std::shared_ptr<const PeerIdentity> LinuxSandbox::somebody(const QXAuditToken& caller) const {
  if (caller == QXAuditToken{}) return nullptr;
  auto peer = peers_.find(caller);
  if (!peer || peer->standing == Standing::nobody || peer->uid != ::geteuid()) return nullptr;
  return peer;
}

std::variant<UniqueDescriptor, QXError> LinuxSandbox::redeem(const QXAuditToken& caller, std::string_view token, TokenUse use) {
  const auto peer = somebody(caller);
  if (!peer) return nobodyError();
  const std::shared_lock lock(keyMutex_);
  auto redeemed = redeemer_.redeem(token, use);
  if (auto* error = std::get_if<QXError>(&redeemed)) return std::move(*error);
  auto& file = std::get<RedeemedFile>(redeemed);
  if (use == TokenUse::writing) ledger_.enter(peer->instance, file.identity);
  return std::move(file.file);
}

std::optional<QXError> LinuxSandbox::replaceItem(const QXAuditToken& caller, std::string_view itemToken, std::string_view siblingToken) {
  const auto peer = somebody(caller);
  if (!peer) return nobodyError();
  const std::shared_lock lock(keyMutex_);
  auto replaced = redeemer_.replaceItem(itemToken, siblingToken);
  if (auto* error = std::get_if<QXError>(&replaced)) return std::move(*error);
  // The item is another object now, and the one who put it there may say that it has written it.
  ledger_.enter(peer->instance, std::get<ObjectIdentity>(replaced));
  return std::nullopt;
}

}  // namespace docuvend::linux_platform
