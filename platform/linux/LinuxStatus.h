// How this daemon is: "processIdentifier"; "protections", an array of sentences; "connections", how many are open to all services together;
// "extensions", a dictionary from an extension's identifier to how its process fares.
#pragma once

#include <string>
#include <vector>

#include "platform/linux/extension_host/LinuxExtensionHost.h"
#include "platform/linux/rpc/LinuxRpcService.h"
#include "platform/status.h"

namespace docuvend::linux_platform {

class LinuxStatus final : public QXStatusSource {
 public:
  // Asks the kernel which protections it gives. The service and the host outlive this object.
  LinuxStatus(const LinuxRpcService& rpc, const LinuxExtensionHost& extensionHost);

  // One sentence each: what holds on this kernel, and what is guaranteed where it lacks something.
  [[nodiscard]] const std::vector<std::string>& protections() const { return protections_; }

  QXDictionary platformStatus() override;

 private:
  const LinuxRpcService& rpc_;
  const LinuxExtensionHost& extensionHost_;
  const std::vector<std::string> protections_;
};

}  // namespace docuvend::linux_platform
