#include "platform/linux/sandbox/LinuxSandbox.h"

#include <unistd.h>

#include <cerrno>
#include <string>
#include <utility>

#include "platform/linux/sandbox/SandboxErrors.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kAllowed = 0;

int codeFor(AccessVerdict verdict) {
  switch (verdict) {
    case AccessVerdict::allowedByAccess:
    case AccessVerdict::allowedByRedemption:
      return kAllowed;
    case AccessVerdict::nobody:
    case AccessVerdict::outsideProfile:
      return EPERM;
    case AccessVerdict::unknownOperation:
      return ENOSYS;
    case AccessVerdict::peerGone:
      return ESRCH;
    case AccessVerdict::malformedPath:
      return EINVAL;
    case AccessVerdict::notFound:
    case AccessVerdict::anotherObject:
      return ENOENT;
    case AccessVerdict::accessDenied:
      return EACCES;
  }
  return EPERM;
}

// Whose work waits for one another's. Processes that are not confined do not belong together, and are trusted not to be many.
std::string ownerOf(const PeerIdentity& peer) {
  if (peer.standing == Standing::confined) return peer.bundleIdentifier.value_or("");
  return "process " + std::to_string(peer.pid);
}

QXError nobodyError() { return sandboxError(SandboxErrorCode::notPermitted, "the caller is not known"); }

}  // namespace

std::variant<std::unique_ptr<LinuxSandbox>, QXError> LinuxSandbox::create(const Paths& paths, BundleRegistry& registry,
                                                                          PeerDirectory& peers, QXLogHandle& log) {
  auto session = TokenSession::load(paths, log);
  if (auto* error = std::get_if<QXError>(&session)) return std::move(*error);
  return std::make_unique<LinuxSandbox>(std::get<std::unique_ptr<TokenSession>>(std::move(session)), registry, peers);
}

LinuxSandbox::LinuxSandbox(std::unique_ptr<TokenSession> session, BundleRegistry& registry, PeerDirectory& peers)
    : session_(std::move(session)),
      peers_(peers),
      places_(registry, *session_, containers_, ledger_),
      containers_(registry),
      redeemer_(*session_, containers_),
      query_(registry, peers, ledger_) {
  static_cast<void>(places_.follow());  // what cannot be written is tried again by whoever issues
}

std::optional<std::string> LinuxSandbox::issueReadWriteExtension(const std::string& path) {
  const auto place = containers_.place(path);
  const auto* item = std::get_if<PlacedItem>(&place);
  if (item == nullptr) return std::nullopt;
  places_.followChanges();
  return session_->issue(item->path);
}

std::optional<QXError> LinuxSandbox::invalidateReadWriteExtensions(const std::optional<std::string>& directory) {
  return places_.takeBack(directory);
}

int LinuxSandbox::checkWithoutReport(const QXAuditToken& token, std::string_view operation, const std::string& path) {
  return codeFor(ask(token, operation, path));
}

AccessVerdict LinuxSandbox::ask(const QXAuditToken& token, std::string_view operation, const std::string& path) const {
  return query_.ask(token, operation, path);
}

bool LinuxSandbox::mayReach(const QXAuditToken& caller, std::string_view operation, const std::string& path,
                            const std::optional<std::string>& token) const {
  if (isAllowed(ask(caller, operation, path))) return true;
  return token && somebody(caller) && redeemer_.isFor(*token, path);
}

std::shared_ptr<const PeerIdentity> LinuxSandbox::somebody(const QXAuditToken& caller) const {
  if (caller == QXAuditToken{}) return nullptr;
  auto peer = peers_.find(caller);
  if (!peer || peer->standing == Standing::nobody || peer->uid != ::geteuid()) return nullptr;
  return peer;
}

void LinuxSandbox::redeem(const QXAuditToken& caller, std::string token, TokenUse use, FileCompletion completion) {
  const auto peer = somebody(caller);
  if (!peer) return completion(nobodyError());
  if (auto redeemed = redeemer_.redeemAtOnce(token, use)) return completion(entered(peer->instance, use, std::move(*redeemed)));
  auto directory = redeemer_.directoryOf(token);
  if (auto* error = std::get_if<QXError>(&directory)) return completion(std::move(*error));
  diskWork_.submit(ownerOf(*peer), std::move(std::get<std::string>(directory)),
                   [this, instance = peer->instance, token = std::move(token), use, completion = std::move(completion)] {
                     completion(entered(instance, use, redeemer_.redeem(token, use)));
                   });
}

std::variant<UniqueDescriptor, QXError> LinuxSandbox::entered(const std::string& instance, TokenUse use, TokenRedeemer::Redeemed redeemed) {
  if (auto* error = std::get_if<QXError>(&redeemed)) return std::move(*error);
  auto& file = std::get<RedeemedFile>(redeemed);
  if (use == TokenUse::writing) ledger_.enter(instance, {file.identity, file.path});
  return std::move(file.file);
}

void LinuxSandbox::replaceItem(const QXAuditToken& caller, std::string itemToken, std::string siblingToken, Completion completion) {
  const auto peer = somebody(caller);
  if (!peer) return completion(nobodyError());
  // What waits is no longer than a good token.
  auto directory = redeemer_.directoryOf(itemToken);
  auto siblings = redeemer_.directoryOf(siblingToken);
  for (auto* found : {&directory, &siblings}) {
    if (auto* error = std::get_if<QXError>(found)) return completion(std::move(*error));
  }
  diskWork_.submit(ownerOf(*peer), std::move(std::get<std::string>(directory)),
                   [this, instance = peer->instance, itemToken = std::move(itemToken), siblingToken = std::move(siblingToken),
                    completion = std::move(completion)] { completion(replaceItemNow(instance, itemToken, siblingToken)); });
}

std::optional<QXError> LinuxSandbox::replaceItemNow(const std::string& instance, const std::string& itemToken,
                                                    const std::string& siblingToken) {
  auto replaced = redeemer_.replaceItem(itemToken, siblingToken);
  if (auto* error = std::get_if<QXError>(&replaced)) return std::move(*error);
  auto& item = std::get<ReplacedItem>(replaced);
  // The item is another object now, and the one who put it there may say that it has written it; not by a token that was taken back while
  // the rename stood in line.
  if (session_->isGood(item.inUse.token)) ledger_.enter(instance, {item.identity, item.path});
  return TokenRedeemer::forceToDisk(std::move(item));
}

}  // namespace docuvend::linux_platform
