#include "platform/linux/sandbox/SandboxErrors.h"

#include <cerrno>
#include <memory>

namespace docuvend::linux_platform {
namespace {

SandboxErrorCode codeFor(int errnoValue) {
  switch (errnoValue) {
    case EWOULDBLOCK:  // a lease
    case ETXTBSY:
      return SandboxErrorCode::busy;
    case ENOENT:
    case ENOTDIR:
    case ESTALE:
      return SandboxErrorCode::gone;
    case EACCES:
    case EPERM:
    case EROFS:
      return SandboxErrorCode::notPermitted;
    case ELOOP:
    case EISDIR:
      return SandboxErrorCode::notRegularFile;
    default:
      return SandboxErrorCode::failed;
  }
}

SandboxErrorCode codeFor(PathRefusal refusal) {
  switch (refusal) {
    case PathRefusal::symbolicLink:
    case PathRefusal::notRegularFile:
    case PathRefusal::severalLinks:
      return SandboxErrorCode::notRegularFile;
    case PathRefusal::outsideContainers:
    case PathRefusal::noParent:
      return SandboxErrorCode::gone;
    case PathRefusal::unsteady:
      return SandboxErrorCode::busy;
    case PathRefusal::notAbsolute:
    case PathRefusal::malformed:
    case PathRefusal::unreachable:
      return SandboxErrorCode::notPermitted;
  }
  return SandboxErrorCode::failed;
}

}  // namespace

QXError sandboxError(SandboxErrorCode code, std::string description) {
  return QXError::make(kQXSandboxErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

QXError sandboxErrorFor(SystemFailure failure, const std::string& attempt) {
  QXError error = sandboxError(codeFor(failure.code), attempt);
  error.underlying = std::make_shared<const QXError>(QXError::system(failure.code, attempt));
  return error;
}

QXError sandboxErrorFor(PathRefusal refusal) { return sandboxError(codeFor(refusal), std::string(describe(refusal))); }

}  // namespace docuvend::linux_platform
