#include "tools/docuvendctl/Outcome.h"

#include <gtest/gtest.h>

#include <vector>

#include "common/DVErrors.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/rpc_errors.h"
#include "sdk/Consumer.h"

namespace docuvend::ctl {
namespace {

QXError own(ConsumerErrorCode code) { return QXError::make(kConsumerErrorDomain, static_cast<std::int64_t>(code), "x"); }

TEST(Outcome, AKindOfFailureHasAStatusOfItsOwn) {
  const QXURL url = *QXURL::fromString("file:///x");
  const QXError foreign = QXError::make("CellarErrorDomain", 1, "x");
  const std::vector<std::pair<QXError, ExitStatus>> table = {
      {DVClientLacksEntitlement(), ExitStatus::notPermitted},
      {DVNotPermittedError(), ExitStatus::notPermitted},
      {DVInvalidBookmarkableStringError(), ExitStatus::invalidInput},
      {DVInvalidParameterError("URL", std::nullopt), ExitStatus::invalidInput},
      {DVNotFoundError(ProviderID{"p"}), ExitStatus::notFound},
      {DVNotFoundErrorURL(url), ExitStatus::notFound},
      {DVPluginOperationFailedError(std::nullopt), ExitStatus::providerFailed},
      {DVPluginOperationFailedError(foreign), ExitStatus::providerFailed},
      {DVProxyNotFoundError(ProviderID{"p"}), ExitStatus::providerFailed},
      {DVSandboxExtensionFailedError(url), ExitStatus::notPermitted},
      // A bad argument is reported inside a not-found error.
      {DVNotFoundError(DVInvalidParameterError("providerID", "p")), ExitStatus::invalidInput},
      {DVNotFoundError(DVNotFoundError(ProviderID{"p"})), ExitStatus::notFound},
      {DVNotFoundError(foreign), ExitStatus::notFound},
      {own(ConsumerErrorCode::unreachable), ExitStatus::unreachable},
      {own(ConsumerErrorCode::deadlinePassed), ExitStatus::deadlinePassed},
      {own(ConsumerErrorCode::noAnswer), ExitStatus::notFound},
      {own(ConsumerErrorCode::noToken), ExitStatus::notPermitted},
      {QXError::make(linux_platform::kQXSandboxErrorDomain, 3, "x"), ExitStatus::fileError},
      {QXError::system(2, "x"), ExitStatus::fileError},
      {foreign, ExitStatus::other},
      {QXError::make(kQXRpcErrorDomain, static_cast<std::int64_t>(QXRpcErrorCode::refused), "x"), ExitStatus::other},
      {QXError::make(kDVErrorDomain, 999, "x"), ExitStatus::other},
      {QXError::make(kConsumerErrorDomain, 999, "x"), ExitStatus::other},
  };
  for (const auto& [error, status] : table) EXPECT_EQ(statusOf(error), status) << error.description();
}

}  // namespace
}  // namespace docuvend::ctl
