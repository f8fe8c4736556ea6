#include "platform/linux/sandbox/SandboxListenerDelegate.h"

#include "platform/linux/sandbox/SandboxServicer.h"
#include "platform/linux/wire/SandboxProtocol.h"

namespace docuvend::linux_platform {

bool SandboxListenerDelegate::listener(QXRpcListener& /*listener*/, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) {
  auto servicer = std::make_shared<SandboxServicer>(sandbox_, log_, shouldAcceptNewConnection);
  shouldAcceptNewConnection->setExportedInterface(qxInterfaceOf<QXSandboxRedemption>());
  shouldAcceptNewConnection->setExportedObject(std::make_shared<QXRpcExport<QXSandboxRedemption>>(std::move(servicer)));
  shouldAcceptNewConnection->resume();
  return true;
}

}  // namespace docuvend::linux_platform
