// A directory that says what the test wants, and remembers nothing but declarations.
#pragma once

#include <sys/socket.h>
#include <unistd.h>

#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <utility>

#include "platform/linux/identity/PeerIdentity.h"

namespace docuvend::tests {

class TestPeerDirectory final : public linux_platform::PeerDirectory {
 public:
  // Who connects from now on.
  void setNextPeer(linux_platform::Standing standing, std::optional<std::string> bundleIdentifier, QXDictionary entitlements) {
    const std::lock_guard lock(mutex_);
    standing_ = standing;
    bundleIdentifier_ = std::move(bundleIdentifier);
    entitlements_ = std::move(entitlements);
  }
  // Whether there are descriptors to look at who connects with.
  void setCanLook(bool canLook) {
    const std::lock_guard lock(mutex_);
    canLook_ = canLook;
  }
  // May be declared by unconfined peers.
  void install(const std::string& bundleIdentifier, QXDictionary entitlements) {
    const std::lock_guard lock(mutex_);
    installed_[bundleIdentifier] = std::move(entitlements);
  }

  std::shared_ptr<const linux_platform::PeerIdentity> identify(int) override {
    const std::lock_guard lock(mutex_);
    if (!canLook_) return nullptr;
    auto identity = std::make_shared<linux_platform::PeerIdentity>();
    identity->pid = ::getpid();
    identity->uid = ::geteuid();
    identity->standing = standing_;
    identity->entitlements = entitlements_;
    if (standing_ == linux_platform::Standing::nobody) return identity;
    identity->token = tokenOf(++connections_);
    identity->bundleIdentifier = bundleIdentifier_;
    return identity;
  }
  std::shared_ptr<const linux_platform::PeerIdentity> declare(const linux_platform::PeerIdentity& peer,
                                                              const std::string& bundleIdentifier) override {
    const std::lock_guard lock(mutex_);
    const auto found = installed_.find(bundleIdentifier);
    if (peer.standing != linux_platform::Standing::unconfined || found == installed_.end()) return nullptr;
    auto identity = std::make_shared<linux_platform::PeerIdentity>();
    identity->pid = peer.pid;
    identity->uid = peer.uid;
    identity->standing = peer.standing;
    identity->token = peer.token;
    identity->bundleIdentifier = bundleIdentifier;
    identity->entitlements = found->second;
    return identity;
  }
  // The bundle is replaced: whoever was started from it is not what it was any more.
  void replace(const std::string& bundleIdentifier) {
    const std::lock_guard lock(mutex_);
    replaced_.insert(bundleIdentifier);
  }
  bool isCurrent(const linux_platform::PeerIdentity& peer) override {
    const std::lock_guard lock(mutex_);
    return peer.standing != linux_platform::Standing::confined || !replaced_.contains(peer.bundleIdentifier.value_or(""));
  }
  std::shared_ptr<const linux_platform::PeerIdentity> find(const QXAuditToken&) override { return nullptr; }

  [[nodiscard]] static QXAuditToken tokenOf(std::uint8_t connection) {
    QXAuditToken token;
    token.bytes[0] = connection;
    return token;
  }

 private:
  std::mutex mutex_;
  linux_platform::Standing standing_ = linux_platform::Standing::confined;
  std::optional<std::string> bundleIdentifier_ = "com.example.App";
  QXDictionary entitlements_;
  std::map<std::string, QXDictionary> installed_;
  std::set<std::string> replaced_;
  std::uint8_t connections_ = 0;
  bool canLook_ = true;
};

}  // namespace docuvend::tests
