#include "platform/linux/sandbox/SandboxServicer.h"

#include <string>
#include <utility>
#include <variant>

#include "platform/QXLogMessage.h"

namespace docuvend::linux_platform {
namespace {

std::string textOf(const std::optional<QXData>& token) { return token ? token->text() : std::string(); }

}  // namespace

void SandboxServicer::redeemToken(std::optional<QXData> token, std::optional<bool> forWriting, FileReply completionHandler) {
  // The connection may let go of this before it is done.
  sandbox_.redeem(
      caller(), textOf(token), forWriting.value_or(false) ? TokenUse::writing : TokenUse::reading,
      [self = shared_from_this(), completionHandler = std::move(completionHandler)](std::variant<UniqueDescriptor, QXError> redeemed) {
        auto* error = std::get_if<QXError>(&redeemed);
        if (error != nullptr) self->noteRefusal(*error);
        if (!completionHandler) return;
        if (error != nullptr) return completionHandler(std::move(*error), /*file=*/{});
        completionHandler(/*error=*/{}, toValue(std::move(std::get<UniqueDescriptor>(redeemed))));
      });
}

void SandboxServicer::replaceItemWithToken(std::optional<QXData> itemToken, std::optional<QXData> bySiblingWithToken,
                                           ErrorReply completionHandler) {
  sandbox_.replaceItem(caller(), textOf(itemToken), textOf(bySiblingWithToken),
                       [self = shared_from_this(), completionHandler = std::move(completionHandler)](std::optional<QXError> error) {
                         if (error) self->noteRefusal(*error);
                         if (completionHandler) completionHandler(std::move(error));
                       });
}

QXAuditToken SandboxServicer::caller() const {
  const auto connection = connection_.lock();
  return connection ? connection->auditToken() : QXAuditToken{};
}

void SandboxServicer::noteRefusal(const QXError& error) {
  if (error.code != static_cast<std::int64_t>(SandboxErrorCode::badToken) || noted_.exchange(true)) return;
  const auto connection = connection_.lock();
  const int pid = connection ? connection->processIdentifier() : 0;
  qxLog(log_, "[NOTICE] Refusing a sandbox token from PID %d: %@", pid, error);
}

}  // namespace docuvend::linux_platform
