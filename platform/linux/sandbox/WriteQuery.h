// "May this process write this path?"
//
// Yes when the process reaches, under that path, the same object as this daemon does, and both the system's access rules in the process's
// own view and its launch profile let it write; or when the object was handed to its launch for writing. Everything is asked, nothing is
// opened. May be used from any thread.
#pragma once

#include <string>
#include <string_view>

#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/identity/PeerIdentity.h"
#include "platform/linux/sandbox/RedemptionLedger.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

enum class WriteVerdict {
  allowedByAccess,
  allowedByRedemption,
  nobody,            // the zero token, an unknown one, or a process without standing
  unknownOperation,  // only writing can be asked about
  peerGone,
  malformedPath,
  notFound,       // neither the file nor its directory is there
  anotherObject,  // the process would reach something else, or nothing
  accessDenied,
  outsideProfile,
};

[[nodiscard]] constexpr bool isAllowed(WriteVerdict verdict) {
  return verdict == WriteVerdict::allowedByAccess || verdict == WriteVerdict::allowedByRedemption;
}

class WriteQuery {
 public:
  // All outlive it.
  WriteQuery(BundleRegistry& registry, PeerDirectory& peers, const RedemptionLedger& ledger)
      : registry_(registry), peers_(peers), ledger_(ledger) {}

  [[nodiscard]] WriteVerdict ask(const QXAuditToken& token, std::string_view operation, const std::string& path) const;

 private:
  [[nodiscard]] WriteVerdict askAboutFile(const PeerIdentity& peer, int peerRoot, const std::string& path, int object) const;
  [[nodiscard]] WriteVerdict askAboutDirectory(const PeerIdentity& peer, int ownRoot, int peerRoot, const std::string& path) const;
  [[nodiscard]] bool profileAllows(const PeerIdentity& peer, int object) const;

  BundleRegistry& registry_;
  PeerDirectory& peers_;
  const RedemptionLedger& ledger_;
};

}  // namespace docuvend::linux_platform
