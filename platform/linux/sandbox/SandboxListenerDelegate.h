// Accepts everybody at "com.orvane.Sandbox": a token is all that counts there.
#pragma once

#include <memory>

#include "platform/linux/sandbox/LinuxSandbox.h"
#include "platform/log.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

class SandboxListenerDelegate final : public QXRpcListenerDelegate {
 public:
  // Both outlive every connection.
  SandboxListenerDelegate(LinuxSandbox& sandbox, QXLogHandle& log) : sandbox_(sandbox), log_(log) {}

  bool listener(QXRpcListener& listener, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) override;

 private:
  LinuxSandbox& sandbox_;
  QXLogHandle& log_;
};

}  // namespace docuvend::linux_platform
