#include "platform/linux/sandbox/SandboxListenerDelegate.h"

#include "platform/linux/sandbox/SandboxServicer.h"
#include "platform/linux/wire/SandboxProtocol.h"

namespace docuvend::linux_platform {

bool SandboxListenerDelegate::listener(QXRpcListener& /*listener*/, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) {
  qxServe<QXSandboxRedemption>(*shouldAcceptNewConnection, std::make_shared<SandboxServicer>(sandbox_, log_, shouldAcceptNewConnection));
  return true;
}

}  // namespace docuvend::linux_platform
