// The names of the codes that stand on the wire. A code without a name here does not compile; a number that is none has no name.
#pragma once

#include "common/DVErrorCodes.h"
#include "platform/linux/extension_host/ExtensionErrors.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/rpc_errors.h"

namespace docuvend::tests {

inline const char* nameOf(QXRpcErrorCode code) {
  using enum QXRpcErrorCode;
  switch (code) {
    case unknownOperation:
      return "unknownOperation";
    case invalidArguments:
      return "invalidArguments";
    case invalidReply:
      return "invalidReply";
    case notTransmissible:
      return "notTransmissible";
    case tooManyCalls:
      return "tooManyCalls";
    case malformedFrame:
      return "malformedFrame";
    case unsupportedVersion:
      return "unsupportedVersion";
    case peerDoesNotRead:
      return "peerDoesNotRead";
    case refused:
      return "refused";
    case notPermitted:
      return "notPermitted";
  }
  return nullptr;
}

inline const char* nameOf(DVErrorCode code) {
  using enum DVErrorCode;
  switch (code) {
    case clientLacksEntitlement:
      return "clientLacksEntitlement";
    case notPermitted:
      return "notPermitted";
    case invalidBookmarkableString:
      return "invalidBookmarkableString";
    case invalidParameter:
      return "invalidParameter";
    case notFound:
      return "notFound";
    case notFoundURL:
      return "notFoundURL";
    case pluginOperationFailed:
      return "pluginOperationFailed";
    case proxyNotFound:
      return "proxyNotFound";
    case sandboxExtensionFailed:
      return "sandboxExtensionFailed";
  }
  return nullptr;
}

inline const char* nameOf(linux_platform::SandboxErrorCode code) {
  using enum linux_platform::SandboxErrorCode;
  switch (code) {
    case badToken:
      return "badToken";
    case notRegularFile:
      return "notRegularFile";
    case gone:
      return "gone";
    case busy:
      return "busy";
    case notPermitted:
      return "notPermitted";
    case notSiblings:
      return "notSiblings";
    case failed:
      return "failed";
  }
  return nullptr;
}

inline const char* nameOf(linux_platform::FileCoordinationErrorCode code) {
  using enum linux_platform::FileCoordinationErrorCode;
  switch (code) {
    case missingURL:
      return "missingURL";
    case notPermitted:
      return "notPermitted";
    case noProvider:
      return "noProvider";
    case invalidAccessID:
      return "invalidAccessID";
    case wouldDeadlock:
      return "wouldDeadlock";
    case ended:
      return "ended";
    case tooManyAccesses:
      return "tooManyAccesses";
    case noDirectory:
      return "noDirectory";
    case tooManyChanges:
      return "tooManyChanges";
  }
  return nullptr;
}

inline const char* nameOf(linux_platform::ExtensionHostErrorCode code) {
  using enum linux_platform::ExtensionHostErrorCode;
  switch (code) {
    case backingOff:
      return "backingOff";
    case notStarted:
      return "notStarted";
    case notAnswering:
      return "notAnswering";
    case ended:
      return "ended";
    case stopped:
      return "stopped";
    case bundleIsGone:
      return "bundleIsGone";
  }
  return nullptr;
}

}  // namespace docuvend::tests
