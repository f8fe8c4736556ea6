// The failures that the RPC layer itself makes. What a receiver of requests answers is its own affair and has its own domains; a peer that
// leaves is an error of the system (ECONNRESET).
#pragma once

#include <cstdint>
#include <string>
#include <utility>

#include "platform/QXError.h"

namespace docuvend {

inline constexpr const char* kQXRpcErrorDomain = "QXRpcErrorDomain";

// The codes stand on the wire: they are never renumbered.
enum class QXRpcErrorCode : std::int64_t {
  unknownOperation = 1,    // the peer exports no operation of that name
  invalidArguments = 2,    // their number or a type differs from the operation's
  invalidReply = 3,        // the answer differs from the operation's, or holds a type that is not accepted there
  notTransmissible = 4,    // a value that the wire cannot carry; nothing was sent
  tooManyCalls = 5,        // too many messages wait for their answers
  malformedFrame = 6,      // the connection ended: bytes that are no frame
  unsupportedVersion = 7,  // the connection ended: no common version of the protocol
  peerDoesNotRead = 8,     // the connection ended: what was sent to the peer piled up
  refused = 9,             // the connection ended: the service does not want it
  notPermitted = 10,       // nobody knows who asks, and the operation is not for everybody
};

[[nodiscard]] inline QXError qxRpcError(QXRpcErrorCode code, std::string description) {
  return QXError::make(kQXRpcErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

}  // namespace docuvend
