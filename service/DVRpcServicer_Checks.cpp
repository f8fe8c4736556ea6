#include "common/DVLog.h"
#include "platform/QXPlatform.h"
#include "service/DVRequests.h"
#include "service/DVRpcServicer.h"

namespace docuvend {
namespace {

constexpr int kSandboxAllows = 0;

bool isTrueNumber(const QXValue& value) {
  if (const auto* boolean = value.as<bool>()) return *boolean;
  if (const auto* integer = value.as<std::int64_t>()) return *integer != 0;
  if (const auto* real = value.as<double>()) return *real != 0;
  return false;
}

}  // namespace

bool DVRpcServicer::clientHasOneOfAllowedEntitlements(std::span<const std::string_view> entitlements) const {
  const auto client = connection();
  for (const std::string_view name : entitlements) {
    const auto value = client ? client->valueForEntitlement(std::string(name)) : std::nullopt;
    if (value && isTrueNumber(*value)) return true;
  }
  dvLog("[ERROR] Rejecting request from PID %d because it does not have any of these entitlements: %@",
        client ? client->processIdentifier() : 0, entitlements);
  return false;
}

bool DVRpcServicer::clientHasSandboxAccessToFile(const QXURL& url) const {
  return QXPlatform::current().sandbox.checkWithoutReport(clientAuditToken(), kQXSandboxFileWriteData, url.fileSystemPath()) ==
         kSandboxAllows;
}

void DVRpcServicer::wakeUpCompletion(Done completion) {
  dvLog("[DEBUG] Serving: %@", dvOperationName<&DVDaemon::wakeUpCompletion>());
  QXPlatform::current().queues.globalQueue().async([completion = std::move(completion)] {
    if (completion) completion();
  });
}

QXAuditToken DVRpcServicer::clientAuditToken() const {
  const auto client = connection();
  return client ? client->auditToken() : QXAuditToken{};
}

std::optional<ConsumerID> DVRpcServicer::clientBundleIdentifier() const {
  auto identifier = QXPlatform::current().applicationRegistry.bundleIdentifierForAuditToken(clientAuditToken());
  if (!identifier) return std::nullopt;
  return ConsumerID{*std::move(identifier)};
}

std::shared_ptr<DVAccessControlStore> DVRpcServicer::accessControlStore() const {
  const auto source = server();
  return source ? source->accessControlStore() : nullptr;
}

}  // namespace docuvend
