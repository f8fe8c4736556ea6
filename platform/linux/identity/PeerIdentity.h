// Who is at the other end of a socket.
//
// Identity is given at launch and kept by the kernel: the daemon reads it once per connection, from the peer's pidfd, its mount
// namespace, that namespace's owning user namespace and that one's parent. Owner is a direct child of the daemon's own user namespace:
// the description at the root of that mount namespace is believed. Owner is the daemon's own user namespace: the process is
// unconfined. Anything else is nobody, who may do nothing but wake the daemon.
//
// A confined process is its bundle as long as the very bundle that it was started from is installed. When that is removed or replaced, by
// another maker's bundle of that identifier or by its own next version (nobody can tell these apart), the process is nobody until it is
// started again: it gains neither the successor's entitlements nor the grants that are made to it.
#pragma once

#include <sys/types.h>

#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

enum class Standing { nobody, unconfined, confined };

struct PeerIdentity {
  pid_t pid = 0;
  uid_t uid = 0;
  Standing standing = Standing::nobody;
  QXAuditToken token;                           // all zero for nobody
  std::optional<std::string> bundleIdentifier;  // confined: from the description; unconfined: what it declared, if anything
  std::string incarnation;                      // confined: of the bundle that it was started from (Bundle.h); else empty
  std::string instance;                         // confined: names this one launch of the application; else empty
  UniqueDescriptor pidfd;                       // held for the connection's life; empty when the kernel gave none
  QXDictionary entitlements;                    // what the bundle said when the peer connected
};

// The identities of the peers that are connected now. May be used from any thread.
class PeerDirectory {
 public:
  PeerDirectory() = default;
  PeerDirectory(const PeerDirectory&) = delete;
  PeerDirectory& operator=(const PeerDirectory&) = delete;
  virtual ~PeerDirectory() = default;

  // Reads the peer of a connected socket. A peer that cannot be read is nobody; null when it is this process that has no descriptors left
  // to look with: nothing is known of the peer then.
  [[nodiscard]] virtual std::shared_ptr<const PeerIdentity> identify(int socket) = 0;
  // An unconfined peer says which installed bundle it acts for, once per process; logged. The new identity, or null when the peer is not
  // unconfined, the bundle is not installed, or the process has declared another bundle on a connection that is still open.
  [[nodiscard]] virtual std::shared_ptr<const PeerIdentity> declare(const PeerIdentity& peer, const std::string& bundleIdentifier) = 0;
  // Whether the peer is still who it was: the bundle that a confined one was started from is installed, and none in its place.
  [[nodiscard]] virtual bool isCurrent(const PeerIdentity& peer) = 0;
  // The connected peer with that token, else null.
  [[nodiscard]] virtual std::shared_ptr<const PeerIdentity> find(const QXAuditToken& token) = 0;
};

}  // namespace docuvend::linux_platform
