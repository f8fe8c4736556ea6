#include "tools/docuvendctl/Outcome.h"

#include <gtest/gtest.h>

#include <vector>

#include "common/DVErrors.h"
#include "platform/linux/bundles/BundleErrors.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/rpc_errors.h"
#include "sdk/ConsumerErrors.h"

namespace docuvend::ctl {
namespace {

using linux_platform::BundleErrorCode;
using linux_platform::FileCoordinationErrorCode;

QXError own(ConsumerErrorCode code) { return QXError::make(kConsumerErrorDomain, static_cast<std::int64_t>(code), "x"); }

QXError bundle(BundleErrorCode code) { return linux_platform::bundleError(code, "x"); }

QXError coordination(FileCoordinationErrorCode code) {
  return QXError::make(linux_platform::kQXFileCoordinationErrorDomain, static_cast<std::int64_t>(code), "x");
}

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
      {own(ConsumerErrorCode::connectionLost), ExitStatus::unreachable},
      {own(ConsumerErrorCode::noAnswer), ExitStatus::notFound},
      {own(ConsumerErrorCode::noToken), ExitStatus::notPermitted},
      {QXError::make(linux_platform::kQXSandboxErrorDomain, 3, "x"), ExitStatus::fileError},
      {QXError::system(2, "x"), ExitStatus::fileError},
      {coordination(FileCoordinationErrorCode::missingURL), ExitStatus::invalidInput},
      {coordination(FileCoordinationErrorCode::notPermitted), ExitStatus::notPermitted},
      {coordination(FileCoordinationErrorCode::noProvider), ExitStatus::notFound},
      {coordination(FileCoordinationErrorCode::noDirectory), ExitStatus::notFound},
      {coordination(FileCoordinationErrorCode::wouldDeadlock), ExitStatus::deadlinePassed},
      {coordination(FileCoordinationErrorCode::ended), ExitStatus::deadlinePassed},
      {coordination(FileCoordinationErrorCode::invalidAccessID), ExitStatus::other},
      {coordination(FileCoordinationErrorCode::tooManyAccesses), ExitStatus::other},
      {coordination(FileCoordinationErrorCode::tooManyChanges), ExitStatus::other},
      {bundle(BundleErrorCode::noBundle), ExitStatus::invalidInput},
      {bundle(BundleErrorCode::forbidden), ExitStatus::invalidInput},
      {bundle(BundleErrorCode::tooLarge), ExitStatus::invalidInput},
      {bundle(BundleErrorCode::notPermitted), ExitStatus::notPermitted},
      {bundle(BundleErrorCode::notFound), ExitStatus::notFound},
      {bundle(BundleErrorCode::inTheWay), ExitStatus::fileError},
      {bundle(BundleErrorCode::notItsOwn), ExitStatus::notPermitted},
      {makeControlError(ControlErrorCode::usage, "x"), ExitStatus::usage},
      {makeControlError(ControlErrorCode::confined, "x"), ExitStatus::notPermitted},
      {foreign, ExitStatus::other},
      {QXError::make(kQXRpcErrorDomain, static_cast<std::int64_t>(QXRpcErrorCode::refused), "x"), ExitStatus::other},
      {QXError::make(kDVErrorDomain, 999, "x"), ExitStatus::other},
      {QXError::make(kConsumerErrorDomain, 999, "x"), ExitStatus::other},
      {QXError::make(kControlErrorDomain, 999, "x"), ExitStatus::other},
      {QXError::make(linux_platform::kBundleErrorDomain, 999, "x"), ExitStatus::other},
  };
  for (const auto& [error, status] : table) EXPECT_EQ(statusOf(error), status) << error.description();
}

TEST(Outcome, ItsOwnFailuresAreToldWithoutDomainAndCode) {
  EXPECT_EQ(messageOf(makeControlError(ControlErrorCode::usage, "no command")), "no command");
  EXPECT_EQ(messageOf(DVNotPermittedError()), DVNotPermittedError().description());
}

}  // namespace
}  // namespace docuvend::ctl
