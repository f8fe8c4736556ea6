// The path is walked twice, below this process's root and below the root of the peer's mount view, and both walks must end at one object.
// An application can build a provider's path inside its own private directories: the same name, another file. Access is then asked of
// the peer's descriptor, because the mount it was reached by belongs to the answer: a read-only mount refuses what the file's mode allows.
//
// A peer can die and its process identifier be given away between any two steps. Its root is opened first and its pidfd asked afterwards:
// if it lives then, the root was its own.

#include "platform/linux/sandbox/WriteQuery.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <optional>

#include "platform/linux/sandbox/Resolution.h"
#include "platform/sandbox.h"

namespace docuvend::linux_platform {
namespace {

enum class Wanted : int { changeFile = W_OK, addToDirectory = W_OK | X_OK };

bool isAlive(const PeerIdentity& peer) {
  if (!peer.pidfd) return false;  // nothing else tells it from its successor
  pollfd question{peer.pidfd.get(), POLLIN, 0};
  return ::poll(&question, 1, /*timeout=*/0) == 0;
}

bool mayAccess(int object, Wanted wanted) {
  return ::syscall(SYS_faccessat2, object, "", static_cast<int>(wanted), AT_EMPTY_PATH | AT_EACCESS) == 0;
}

std::optional<ObjectIdentity> identityOf(int descriptor) {
  const auto status = statusOf(descriptor);
  if (const auto* known = std::get_if<ObjectStatus>(&status)) return known->identity;
  return std::nullopt;
}

bool isSameObject(int a, int b) {
  const auto first = identityOf(a);
  return first && first == identityOf(b);
}

}  // namespace

WriteVerdict WriteQuery::ask(const QXAuditToken& token, std::string_view operation, const std::string& path) const {
  if (token == QXAuditToken{}) return WriteVerdict::nobody;
  if (operation != kQXSandboxFileWriteData) return WriteVerdict::unknownOperation;
  if (!path.starts_with('/') || path.find('\0') != std::string::npos) return WriteVerdict::malformedPath;
  const auto peer = peers_.find(token);
  if (!peer || peer->standing == Standing::nobody || peer->uid != ::geteuid()) return WriteVerdict::nobody;

  const auto peerRoot = openDirectory("/proc/" + std::to_string(peer->pid) + "/root");
  if (!isAlive(*peer)) return WriteVerdict::peerGone;
  const auto ownRoot = openDirectory("/");
  if (!std::holds_alternative<UniqueDescriptor>(ownRoot)) return WriteVerdict::notFound;
  const int ownRootNumber = std::get<UniqueDescriptor>(ownRoot).get();
  const auto object = openInRoot(ownRootNumber, path, FinalLink::followed);

  // A redemption counts whatever the peer sees of the path: the file is open in its hands.
  if (const auto* opened = std::get_if<UniqueDescriptor>(&object)) {
    const auto identity = identityOf(opened->get());
    if (identity && ledger_.holds(peer->instance, *identity)) return WriteVerdict::allowedByRedemption;
  }
  if (!std::holds_alternative<UniqueDescriptor>(peerRoot)) return WriteVerdict::accessDenied;
  const int peerRootNumber = std::get<UniqueDescriptor>(peerRoot).get();
  if (const auto* opened = std::get_if<UniqueDescriptor>(&object)) return askAboutFile(*peer, peerRootNumber, path, opened->get());
  if (std::get<SystemFailure>(object).code != ENOENT) return WriteVerdict::accessDenied;
  return askAboutDirectory(*peer, ownRootNumber, peerRootNumber, path);
}

WriteVerdict WriteQuery::askAboutFile(const PeerIdentity& peer, int peerRoot, const std::string& path, int object) const {
  const auto seen = openInRoot(peerRoot, path, FinalLink::followed);
  const auto* reached = std::get_if<UniqueDescriptor>(&seen);
  if (reached == nullptr || !isSameObject(reached->get(), object)) return WriteVerdict::anotherObject;
  if (!mayAccess(reached->get(), Wanted::changeFile)) return WriteVerdict::accessDenied;
  return profileAllows(peer, object) ? WriteVerdict::allowedByAccess : WriteVerdict::outsideProfile;
}

// Nothing is there yet: whoever may add to the directory may write it.
WriteVerdict WriteQuery::askAboutDirectory(const PeerIdentity& peer, int ownRoot, int peerRoot, const std::string& path) const {
  // A link that leads nowhere is something.
  for (const int root : {ownRoot, peerRoot}) {
    const auto entry = openInRoot(root, path, FinalLink::itself);
    if (std::holds_alternative<UniqueDescriptor>(entry)) return WriteVerdict::anotherObject;
    if (std::get<SystemFailure>(entry).code != ENOENT) return WriteVerdict::accessDenied;
  }
  const std::string parent = path.substr(0, path.rfind('/') + 1);
  const auto own = openInRoot(ownRoot, parent, FinalLink::followed);
  const auto* object = std::get_if<UniqueDescriptor>(&own);
  if (object == nullptr) return WriteVerdict::notFound;
  const auto seen = openInRoot(peerRoot, parent, FinalLink::followed);
  const auto* reached = std::get_if<UniqueDescriptor>(&seen);
  if (reached == nullptr || !isSameObject(reached->get(), object->get())) return WriteVerdict::anotherObject;
  if (!mayAccess(reached->get(), Wanted::addToDirectory)) return WriteVerdict::accessDenied;
  return profileAllows(peer, object->get()) ? WriteVerdict::allowedByAccess : WriteVerdict::outsideProfile;
}

bool WriteQuery::profileAllows(const PeerIdentity& peer, int object) const {
  if (peer.standing == Standing::unconfined) return true;
  if (!peer.bundleIdentifier) return false;
  const auto bundle = registry_.find(*peer.bundleIdentifier);
  const auto path = kernelPath(object);
  if (!bundle || !path) return false;
  const auto liesIn = [&path](const std::string& writable) {
    const auto directory = openDirectory(writable);
    const auto* opened = std::get_if<UniqueDescriptor>(&directory);
    const auto canonical = opened == nullptr ? std::nullopt : kernelPath(opened->get());
    return canonical && (*canonical == *path || liesBelow(*canonical, *path));
  };
  if (liesIn(bundle->container)) return true;
  for (const auto& [group, directory] : bundle->groups) {
    if (liesIn(directory)) return true;
  }
  return false;
}

}  // namespace docuvend::linux_platform
