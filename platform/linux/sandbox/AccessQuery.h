// "May this process read this path?" and "May this process write this path?"
//
// Yes when the process reaches, under that path, the same object as this daemon does, and both the system's access rules in the process's
// own view and its launch profile let it; or when the object was handed to its launch for writing, which counts for reading too. Of a file
// that is not there yet its directory is asked: whoever may search it may read the file, whoever may add to it may write it. Everything is
// asked, nothing is opened. May be used from any thread.
#pragma once

#include <string>
#include <string_view>

#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/identity/PeerIdentity.h"
#include "platform/linux/sandbox/RedemptionLedger.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

enum class AccessVerdict {
  allowedByAccess,
  allowedByRedemption,
  nobody,            // the zero token, an unknown one, or a process without standing
  unknownOperation,  // only reading and writing can be asked about
  peerGone,
  malformedPath,
  notFound,       // neither the file nor its directory is there
  anotherObject,  // the process would reach something else, or nothing
  accessDenied,
  outsideProfile,
};

[[nodiscard]] constexpr bool isAllowed(AccessVerdict verdict) {
  return verdict == AccessVerdict::allowedByAccess || verdict == AccessVerdict::allowedByRedemption;
}

class AccessQuery {
 public:
  // All outlive it.
  AccessQuery(BundleRegistry& registry, PeerDirectory& peers, const RedemptionLedger& ledger)
      : registry_(registry), peers_(peers), ledger_(ledger) {}

  [[nodiscard]] AccessVerdict ask(const QXAuditToken& token, std::string_view operation, const std::string& path) const;

 private:
  enum class Operation { reading, writing };
  struct Question;

  [[nodiscard]] AccessVerdict askAboutFile(const Question& question, int object) const;
  [[nodiscard]] AccessVerdict askAboutDirectory(const Question& question) const;
  [[nodiscard]] AccessVerdict askProfile(const Question& question, int object) const;
  [[nodiscard]] bool profileAllows(const Question& question, int object) const;

  BundleRegistry& registry_;
  PeerDirectory& peers_;
  const RedemptionLedger& ledger_;
};

}  // namespace docuvend::linux_platform
