// The path is walked twice, below this process's root and below the root of the peer's mount view, and both walks must end at one object.
// An application can build a provider's path inside its own private directories: the same name, another file. Access is then asked of
// the peer's descriptor, because the mount it was reached by belongs to the answer: a read-only mount refuses what the file's mode allows.
//
// What a confined process sees under the daemon's own path was bound there by its launch, but the profile is asked all the same: it says
// what of that may be written, and does not rest on the view.
//
// A peer can die and its process identifier be given away between any two steps. Its root is opened first and its pidfd asked afterwards:
// if it lives then, the root was its own.

#include "platform/linux/sandbox/AccessQuery.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <optional>
#include <vector>

#include "platform/linux/launch/HostLayout.h"
#include "platform/linux/sandbox/Resolution.h"
#include "platform/sandbox.h"

namespace docuvend::linux_platform {
namespace {

enum class Wanted : int { readFile = R_OK, changeFile = W_OK, searchDirectory = X_OK, addToDirectory = W_OK | X_OK };

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

bool liesIn(const std::vector<std::string>& places, const std::string& path) {
  return std::any_of(places.begin(), places.end(), [&path](const std::string& place) {
    const UniqueDescriptor opened(::open(place.c_str(), O_PATH | O_CLOEXEC));
    const auto canonical = opened ? kernelPath(opened.get()) : std::nullopt;
    return canonical && (*canonical == path || liesBelow(*canonical, path));
  });
}

std::vector<std::string> containersOf(const Bundle& bundle) {
  std::vector<std::string> places = {bundle.container};
  for (const auto& [group, directory] : bundle.groups) places.push_back(directory);
  return places;
}

// What every launch binds of the host, besides what is the bundle's.
std::vector<std::string> systemPlaces() {
  const HostLayout host = HostLayout::read();
  std::vector<std::string> places;
  for (const auto* paths : {&host.systemDirectories, &host.systemFiles, &host.networkFiles}) {
    places.insert(places.end(), paths->begin(), paths->end());
  }
  return places;
}

}  // namespace

struct AccessQuery::Question {
  const PeerIdentity& peer;
  Operation operation;
  const std::string& path;
  int ownRoot;
  int peerRoot;
};

AccessVerdict AccessQuery::ask(const QXAuditToken& token, std::string_view operation, const std::string& path) const {
  if (token == QXAuditToken{}) return AccessVerdict::nobody;
  if (operation != kQXSandboxFileReadData && operation != kQXSandboxFileWriteData) return AccessVerdict::unknownOperation;
  if (!path.starts_with('/') || path.find('\0') != std::string::npos) return AccessVerdict::malformedPath;
  const auto peer = peers_.find(token);
  if (!peer || peer->standing == Standing::nobody || peer->uid != ::geteuid()) return AccessVerdict::nobody;

  const auto peerRoot = openDirectory("/proc/" + std::to_string(peer->pid) + "/root");
  if (!isAlive(*peer)) return AccessVerdict::peerGone;
  const auto ownRoot = openDirectory("/");
  if (!std::holds_alternative<UniqueDescriptor>(ownRoot)) return AccessVerdict::notFound;
  const int ownRootNumber = std::get<UniqueDescriptor>(ownRoot).get();
  const auto object = openInRoot(ownRootNumber, path, FinalLink::followed);

  // A redemption counts whatever the peer sees of the path: the file is open in its hands.
  if (const auto* opened = std::get_if<UniqueDescriptor>(&object)) {
    const auto identity = identityOf(opened->get());
    if (identity && ledger_.holds(peer->instance, *identity)) return AccessVerdict::allowedByRedemption;
  }
  if (!std::holds_alternative<UniqueDescriptor>(peerRoot)) return AccessVerdict::accessDenied;
  const Question question{*peer, operation == kQXSandboxFileReadData ? Operation::reading : Operation::writing, path, ownRootNumber,
                          std::get<UniqueDescriptor>(peerRoot).get()};
  if (const auto* opened = std::get_if<UniqueDescriptor>(&object)) return askAboutFile(question, opened->get());
  if (std::get<SystemFailure>(object).code != ENOENT) return AccessVerdict::accessDenied;
  return askAboutDirectory(question);
}

AccessVerdict AccessQuery::askAboutFile(const Question& question, int object) const {
  const auto seen = openInRoot(question.peerRoot, question.path, FinalLink::followed);
  const auto* reached = std::get_if<UniqueDescriptor>(&seen);
  if (reached == nullptr || !isSameObject(reached->get(), object)) return AccessVerdict::anotherObject;
  const Wanted wanted = question.operation == Operation::reading ? Wanted::readFile : Wanted::changeFile;
  if (!mayAccess(reached->get(), wanted)) return AccessVerdict::accessDenied;
  return askProfile(question, object);
}

AccessVerdict AccessQuery::askAboutDirectory(const Question& question) const {
  // A link that leads nowhere is something.
  for (const int root : {question.ownRoot, question.peerRoot}) {
    const auto entry = openInRoot(root, question.path, FinalLink::itself);
    if (std::holds_alternative<UniqueDescriptor>(entry)) return AccessVerdict::anotherObject;
    if (std::get<SystemFailure>(entry).code != ENOENT) return AccessVerdict::accessDenied;
  }
  const std::string parent = question.path.substr(0, question.path.rfind('/') + 1);
  const auto own = openInRoot(question.ownRoot, parent, FinalLink::followed);
  const auto* object = std::get_if<UniqueDescriptor>(&own);
  if (object == nullptr) return AccessVerdict::notFound;
  const auto seen = openInRoot(question.peerRoot, parent, FinalLink::followed);
  const auto* reached = std::get_if<UniqueDescriptor>(&seen);
  if (reached == nullptr || !isSameObject(reached->get(), object->get())) return AccessVerdict::anotherObject;
  const Wanted wanted = question.operation == Operation::reading ? Wanted::searchDirectory : Wanted::addToDirectory;
  if (!mayAccess(reached->get(), wanted)) return AccessVerdict::accessDenied;
  return askProfile(question, object->get());
}

AccessVerdict AccessQuery::askProfile(const Question& question, int object) const {
  return profileAllows(question, object) ? AccessVerdict::allowedByAccess : AccessVerdict::outsideProfile;
}

bool AccessQuery::profileAllows(const Question& question, int object) const {
  if (question.peer.standing == Standing::unconfined) return true;
  if (!question.peer.bundleIdentifier) return false;
  const auto bundle = registry_.find(*question.peer.bundleIdentifier);
  const auto path = kernelPath(object);
  if (!bundle || !path) return false;
  if (liesIn(containersOf(*bundle), *path)) return true;
  return question.operation == Operation::reading && (liesIn({bundle->directory}, *path) || liesIn(systemPlaces(), *path));
}

}  // namespace docuvend::linux_platform
