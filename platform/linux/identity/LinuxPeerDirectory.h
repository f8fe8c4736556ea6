// The peers of this user's services, read from the kernel when they connect.
//
// The audit token is pid (4 bytes), uid (4), the process's serial (8: its pidfd's inode) and the machine's boot (16), the numbers in the
// machine's own order. Only a socket that the peer itself connected tells who it is: of a socket pair both ends are its maker's.
#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/identity/KernelFacilities.h"
#include "platform/linux/identity/PeerIdentity.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

// The registry and the log outlive it.
class LinuxPeerDirectory final : public PeerDirectory {
 public:
  LinuxPeerDirectory(BundleRegistry& bundles, QXLogHandle& log, KernelFacilities facilities = KernelFacilities::probe());

  [[nodiscard]] std::shared_ptr<const PeerIdentity> identify(int socket) override;
  [[nodiscard]] std::shared_ptr<const PeerIdentity> declare(const PeerIdentity& peer, const std::string& bundleIdentifier) override;
  [[nodiscard]] bool isCurrent(const PeerIdentity& peer) override;
  // Of several connections of one process, one that declared a bundle goes before the others.
  [[nodiscard]] std::shared_ptr<const PeerIdentity> find(const QXAuditToken& token) override;

 private:
  [[nodiscard]] QXAuditToken makeToken(pid_t pid, uid_t uid, std::uint64_t serial) const;
  enum class Look { done, wantsDescriptors };
  [[nodiscard]] Look readPeer(int socket, PeerIdentity& identity);
  void tellOfOutdated(const PeerIdentity& identity, const std::string& bundleIdentifier) const;
  Look becomeNobody(PeerIdentity& identity, const std::string& reason);
  void syncPrune();

  // Constant after construction.
  BundleRegistry& bundles_;
  QXLogHandle& log_;
  const KernelFacilities facilities_;
  const std::array<std::uint8_t, 16> boot_;

  std::mutex mutex_;
  // Guarded by mutex_. No entry keeps a peer alive; those that ended are swept out when the number of processes has doubled.
  std::map<QXAuditToken, std::vector<std::weak_ptr<const PeerIdentity>>> live_;
  std::size_t pruneAt_;
};

}  // namespace docuvend::linux_platform
