#include "platform/linux/identity/LinuxPeerDirectory.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <utility>

#include "platform/QXLogMessage.h"
#include "platform/linux/base/LogSubject.h"
#include "platform/linux/base/kernel.h"
#include "platform/linux/base/pidfd.h"
#include "platform/linux/identity/ProcessReading.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::size_t kFewestBeforePruning = 64;

// Two hexadecimal digits a byte, dashes between.
std::array<std::uint8_t, 16> readBoot() {
  std::array<std::uint8_t, 16> boot{};
  std::string text;
  std::getline(std::ifstream("/proc/sys/kernel/random/boot_id"), text);
  std::erase(text, '-');
  for (std::size_t i = 0; i < boot.size() && 2 * i + 1 < text.size(); ++i) {
    boot[i] = static_cast<std::uint8_t>(std::strtoul(text.substr(2 * i, 2).c_str(), nullptr, 16));
  }
  return boot;
}

UniqueDescriptor openPeer(int socket, pid_t pid, const KernelFacilities& facilities) {
  if (!facilities.peerPidfd) return openPidfd(pid);
  int number = -1;
  socklen_t size = sizeof(number);
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERPIDFD, &number, &size) != 0) return {};
  return UniqueDescriptor(number);
}

void removeEnded(std::vector<std::weak_ptr<const PeerIdentity>>& identities) {
  std::erase_if(identities, [](const auto& identity) { return identity.expired(); });
}

}  // namespace

LinuxPeerDirectory::LinuxPeerDirectory(BundleRegistry& bundles, QXLogHandle& log, KernelFacilities facilities)
    : bundles_(bundles), log_(log), facilities_(facilities), boot_(readBoot()), pruneAt_(kFewestBeforePruning) {}

std::shared_ptr<const PeerIdentity> LinuxPeerDirectory::identify(int socket) {
  auto identity = std::make_shared<PeerIdentity>();
  if (readPeer(socket, *identity) == Look::wantsDescriptors) return nullptr;
  if (identity->standing == Standing::nobody) return identity;
  const std::lock_guard lock(mutex_);
  syncPrune();
  auto& identities = live_[identity->token];
  removeEnded(identities);
  identities.push_back(identity);
  return identity;
}

LinuxPeerDirectory::Look LinuxPeerDirectory::readPeer(int socket, PeerIdentity& identity) {
  ucred credentials{};
  socklen_t size = sizeof(credentials);
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) return becomeNobody(identity, "it has no credentials");
  identity.pid = credentials.pid;
  identity.uid = credentials.uid;
  if (credentials.pid <= 0) return becomeNobody(identity, "its process number is not known here");
  if (credentials.uid != ::geteuid()) return becomeNobody(identity, "it belongs to another user");
  identity.pidfd = openPeer(socket, credentials.pid, facilities_);
  if (!identity.pidfd) return isWantOfDescriptors(errno) ? Look::wantsDescriptors : becomeNobody(identity, "it has ended");

  auto reading = readProcess(credentials.pid, identity.pidfd, facilities_);
  if (const auto* unread = std::get_if<Unread>(&reading)) {
    return unread->isForWantOfDescriptors ? Look::wantsDescriptors : becomeNobody(identity, unread->reason);
  }
  auto& [standing, description, serial] = std::get<ProcessReading>(reading);
  if (description) {
    auto bundle = bundles_.find(description->bundleIdentifier);
    if (!bundle) return becomeNobody(identity, "its bundle " + description->bundleIdentifier + " is not installed");
    if (bundle->incarnation != description->incarnation) {
      tellOfOutdated(identity, description->bundleIdentifier);
      return becomeNobody(identity, "its bundle " + description->bundleIdentifier + " is not the one that is installed");
    }
    identity.bundleIdentifier = description->bundleIdentifier;
    identity.incarnation = description->incarnation;
    identity.instance = description->instance;
    identity.entitlements = std::move(bundle->entitlements);
  }
  identity.standing = standing;
  identity.token = makeToken(identity.pid, identity.uid, serial);
  return Look::done;
}

// At the usual level, for whoever wonders why a program that was at work is refused; the bundle's share of the log is what it costs.
void LinuxPeerDirectory::tellOfOutdated(const PeerIdentity& identity, const std::string& bundleIdentifier) const {
  const LogSubject subject(std::make_shared<const std::string>(bundleIdentifier));
  qxLog(log_, "[NOTICE] PID %d was started from another bundle %@ than the one that is installed now; it is to be started again.",
        identity.pid, bundleIdentifier);
}

bool LinuxPeerDirectory::isCurrent(const PeerIdentity& peer) {
  if (peer.standing != Standing::confined) return true;
  const auto bundle = bundles_.find(*peer.bundleIdentifier);
  return bundle && bundle->incarnation == peer.incarnation;
}

LinuxPeerDirectory::Look LinuxPeerDirectory::becomeNobody(PeerIdentity& identity, const std::string& reason) {
  identity.standing = Standing::nobody;
  qxLog(log_, "[DEBUG] PID %d is nobody: %@.", identity.pid, reason);
  return Look::done;
}

std::shared_ptr<const PeerIdentity> LinuxPeerDirectory::declare(const PeerIdentity& peer, const std::string& bundleIdentifier) {
  if (peer.standing != Standing::unconfined) return nullptr;
  auto bundle = bundles_.find(bundleIdentifier);
  if (!bundle) return nullptr;
  auto identity = std::make_shared<PeerIdentity>();
  identity->pid = peer.pid;
  identity->uid = peer.uid;
  identity->standing = peer.standing;
  identity->token = peer.token;
  identity->bundleIdentifier = bundleIdentifier;
  identity->pidfd.reset(::fcntl(peer.pidfd.get(), F_DUPFD_CLOEXEC, 0));
  identity->entitlements = std::move(bundle->entitlements);
  if (!identity->pidfd) return nullptr;
  {
    const std::lock_guard lock(mutex_);
    auto& identities = live_[peer.token];
    removeEnded(identities);
    for (const auto& other : identities) {
      const auto strongOther = other.lock();
      if (strongOther && strongOther->bundleIdentifier && *strongOther->bundleIdentifier != bundleIdentifier) return nullptr;
    }
    identities.push_back(identity);
  }
  qxLog(log_, "[NOTICE] PID %d declares itself to be %@.", peer.pid, bundleIdentifier);
  return identity;
}

std::shared_ptr<const PeerIdentity> LinuxPeerDirectory::find(const QXAuditToken& token) {
  const std::lock_guard lock(mutex_);
  const auto entry = live_.find(token);
  if (entry == live_.end()) return nullptr;
  std::shared_ptr<const PeerIdentity> found;
  for (const auto& identity : entry->second) {
    auto strongIdentity = identity.lock();
    if (strongIdentity && (!found || (strongIdentity->bundleIdentifier && !found->bundleIdentifier))) found = std::move(strongIdentity);
  }
  return found;
}

QXAuditToken LinuxPeerDirectory::makeToken(pid_t pid, uid_t uid, std::uint64_t serial) const {
  QXAuditToken token;
  auto* place = token.bytes.data();
  const auto put = [&place](const void* bytes, std::size_t count) {
    std::memcpy(place, bytes, count);
    place += count;
  };
  static_assert(sizeof(pid) == 4 && sizeof(uid) == 4);
  put(&pid, sizeof(pid));
  put(&uid, sizeof(uid));
  put(&serial, sizeof(serial));
  put(boot_.data(), boot_.size());
  return token;
}

void LinuxPeerDirectory::syncPrune() {
  if (live_.size() < pruneAt_) return;
  for (auto entry = live_.begin(); entry != live_.end();) {
    removeEnded(entry->second);
    entry = entry->second.empty() ? live_.erase(entry) : std::next(entry);
  }
  pruneAt_ = std::max(kFewestBeforePruning, 2 * live_.size());
}

}  // namespace docuvend::linux_platform
