// Accepts everybody at "com.orvane.FileCoordination"; each operation asks for itself what the caller may do.
#pragma once

#include <memory>

#include "platform/linux/coordination/LinuxFileCoordinator.h"
#include "platform/rpc.h"
#include "platform/sandbox.h"

namespace docuvend::linux_platform {

class FileCoordinationListenerDelegate final : public QXRpcListenerDelegate {
 public:
  // Both outlive every connection.
  FileCoordinationListenerDelegate(LinuxFileCoordinator& coordinator, QXSandbox& sandbox) : coordinator_(coordinator), sandbox_(sandbox) {}

  bool listener(QXRpcListener& listener, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) override;

 private:
  LinuxFileCoordinator& coordinator_;
  QXSandbox& sandbox_;
};

}  // namespace docuvend::linux_platform
