#include "tools/docuvendctl/Outcome.h"

#include <utility>

#include "common/DVErrors.h"
#include "platform/linux/bundles/BundleErrors.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "sdk/ConsumerErrors.h"

namespace docuvend::ctl {
namespace {

using linux_platform::BundleErrorCode;
using linux_platform::FileCoordinationErrorCode;

ExitStatus statusOfBundleError(BundleErrorCode code) {
  switch (code) {
    case BundleErrorCode::noBundle:
    case BundleErrorCode::forbidden:
    case BundleErrorCode::tooLarge:
      return ExitStatus::invalidInput;
    case BundleErrorCode::notPermitted:
    case BundleErrorCode::notItsOwn:
      return ExitStatus::notPermitted;
    case BundleErrorCode::notFound:
      return ExitStatus::notFound;
    case BundleErrorCode::inTheWay:
      return ExitStatus::fileError;
  }
  return ExitStatus::other;
}

ExitStatus statusOfControlError(ControlErrorCode code) {
  switch (code) {
    case ControlErrorCode::usage:
      return ExitStatus::usage;
    case ControlErrorCode::confined:
      return ExitStatus::notPermitted;
  }
  return ExitStatus::other;
}

ExitStatus statusOfCoordinationError(FileCoordinationErrorCode code) {
  switch (code) {
    case FileCoordinationErrorCode::missingURL:
      return ExitStatus::invalidInput;
    case FileCoordinationErrorCode::notPermitted:
      return ExitStatus::notPermitted;
    case FileCoordinationErrorCode::noProvider:
    case FileCoordinationErrorCode::noDirectory:
      return ExitStatus::notFound;
    case FileCoordinationErrorCode::wouldDeadlock:
    case FileCoordinationErrorCode::ended:
      // The turn did not come, and may at another time.
      return ExitStatus::deadlinePassed;
    case FileCoordinationErrorCode::invalidAccessID:
    case FileCoordinationErrorCode::tooManyAccesses:
    case FileCoordinationErrorCode::tooManyChanges:
      break;
  }
  return ExitStatus::other;
}

ExitStatus statusOfSystemError(DVErrorCode code, const QXError& error) {
  switch (code) {
    case DVErrorCode::clientLacksEntitlement:
    case DVErrorCode::notPermitted:
      return ExitStatus::notPermitted;
    case DVErrorCode::invalidBookmarkableString:
    case DVErrorCode::invalidParameter:
      return ExitStatus::invalidInput;
    case DVErrorCode::notFound:
      // What was wrong may stand beneath: a bad argument is reported inside a not-found error.
      return error.underlying && error.underlying->domain == kDVErrorDomain ? statusOf(*error.underlying) : ExitStatus::notFound;
    case DVErrorCode::notFoundURL:
      return ExitStatus::notFound;
    case DVErrorCode::pluginOperationFailed:
    case DVErrorCode::proxyNotFound:
      return ExitStatus::providerFailed;
    case DVErrorCode::sandboxExtensionFailed:
      return ExitStatus::notPermitted;
  }
  return ExitStatus::other;
}

}  // namespace

QXError makeControlError(ControlErrorCode code, std::string description) {
  return QXError::make(kControlErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

ExitStatus statusOf(const QXError& error) {
  if (error.domain == kDVErrorDomain) return statusOfSystemError(static_cast<DVErrorCode>(error.code), error);
  if (error.domain == kConsumerErrorDomain) {
    switch (static_cast<ConsumerErrorCode>(error.code)) {
      case ConsumerErrorCode::unreachable:
      case ConsumerErrorCode::connectionLost:
        return ExitStatus::unreachable;
      case ConsumerErrorCode::deadlinePassed:
        return ExitStatus::deadlinePassed;
      case ConsumerErrorCode::noAnswer:
        return ExitStatus::notFound;
      case ConsumerErrorCode::notTold:
        return ExitStatus::providerFailed;
      case ConsumerErrorCode::noToken:
        return ExitStatus::notPermitted;
    }
  }
  if (error.domain == kControlErrorDomain) return statusOfControlError(static_cast<ControlErrorCode>(error.code));
  if (error.domain == linux_platform::kBundleErrorDomain) return statusOfBundleError(static_cast<BundleErrorCode>(error.code));
  if (error.domain == linux_platform::kQXFileCoordinationErrorDomain) {
    return statusOfCoordinationError(static_cast<FileCoordinationErrorCode>(error.code));
  }
  if (error.domain == linux_platform::kQXSandboxErrorDomain || error.domain == kQXSystemErrorDomain) return ExitStatus::fileError;
  return ExitStatus::other;
}

std::string messageOf(const QXError& error) {
  const auto description = error.texts.find("description");
  return error.domain == kControlErrorDomain && description != error.texts.end() ? description->second : error.description();
}

}  // namespace docuvend::ctl
