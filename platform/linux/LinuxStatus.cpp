#include "platform/linux/LinuxStatus.h"

#include <unistd.h>

#include <cstdint>

#include "platform/linux/identity/KernelFacilities.h"

namespace docuvend::linux_platform {
namespace {

std::vector<std::string> protectionsOfThisKernel() {
  const ProtectionLevels levels = protectionLevels(KernelFacilities::probe());
  return {levels.peers, levels.namespaces, levels.tokens, levels.descriptors, levels.confinement};
}

}  // namespace

LinuxStatus::LinuxStatus(const LinuxRpcService& rpc, const LinuxExtensionHost& extensionHost)
    : rpc_(rpc), extensionHost_(extensionHost), protections_(protectionsOfThisKernel()) {}

QXDictionary LinuxStatus::platformStatus() {
  return {{"processIdentifier", std::int64_t{::getpid()}},
          {"protections", QXArray(protections_.begin(), protections_.end())},
          {"connections", static_cast<std::int64_t>(rpc_.connectionCount())},
          {"extensions", extensionHost_.status()}};
}

}  // namespace docuvend::linux_platform
