// How this daemon is: "processIdentifier"; "protections", an array of sentences; "connections", how many are open to all services together.
#pragma once

#include <string>
#include <vector>

#include "platform/linux/rpc/LinuxRpcService.h"
#include "platform/status.h"

namespace docuvend::linux_platform {

class LinuxStatus final : public QXStatusSource {
 public:
  // Asks the kernel which protections it gives. The service outlives this object.
  explicit LinuxStatus(const LinuxRpcService& rpc);

  // One sentence each: what holds on this kernel, and what is guaranteed where it lacks something.
  [[nodiscard]] const std::vector<std::string>& protections() const { return protections_; }

  QXDictionary platformStatus() override;

 private:
  const LinuxRpcService& rpc_;
  const std::vector<std::string> protections_;
};

}  // namespace docuvend::linux_platform
