#include "tools/docuvendctl/Outcome.h"

#include "common/DVErrors.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "sdk/Consumer.h"

namespace docuvend::ctl {
namespace {

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
  if (error.domain == linux_platform::kQXSandboxErrorDomain || error.domain == kQXSystemErrorDomain) return ExitStatus::fileError;
  return ExitStatus::other;
}

}  // namespace docuvend::ctl
