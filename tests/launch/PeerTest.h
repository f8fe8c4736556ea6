// Peers that connect to a public socket, each a process of its own.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/identity/LinuxPeerDirectory.h"
#include "tests/launch/ConfinedHouse.h"

namespace docuvend::linux_platform {

// The bundles that a test lists.
class ListedBundles final : public BundleRegistry {
 public:
  std::optional<Bundle> find(const std::string& identifier) override {
    const auto found = bundles.find(identifier);
    if (found == bundles.end()) return std::nullopt;
    return found->second;
  }
  std::vector<Bundle> all() override { return {}; }
  void onChange(std::function<void()> callback) override { static_cast<void>(callback); }

  BundleMap bundles;
};

// A process and its connection. The connection closes first: a probe that stays connected then ends.
struct Peer {
  RunningProcess process;
  UniqueDescriptor connection;
};

class PeerTest : public ConfinedTest {
 protected:
  void SetUp() override;

  // Installs the probe with one entitlement and lists it.
  Bundle install(const std::string& identifier);
  [[nodiscard]] Peer confined(const Bundle& bundle, const std::string& attempt = "stay-connected");
  // The probe, not confined. It makes its attempts when it is connected, and is given back when they are made; then it stays until its
  // connection closes.
  [[nodiscard]] Peer unconfined(const std::vector<std::string>& attempts = {});
  // Whom an outsider has bubblewrap confine with arguments of its own; they follow namespaces and a read-only view of everything.
  [[nodiscard]] Peer handMade(const std::vector<std::string>& arguments);
  [[nodiscard]] UniqueDescriptor accept();
  [[nodiscard]] static RunningProcess startProgram(std::vector<std::string> words);

  std::string socketPath_;
  UniqueDescriptor listener_;
  ListedBundles bundles_;
};

}  // namespace docuvend::linux_platform
