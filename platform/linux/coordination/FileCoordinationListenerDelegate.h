// Accepts everybody at "com.orvane.FileCoordination"; each operation asks for itself what the caller may do.
#pragma once

#include <memory>

#include "platform/linux/coordination/FileCoordinationServicer.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

class FileCoordinationListenerDelegate final : public QXRpcListenerDelegate {
 public:
  // What is around outlives every connection.
  explicit FileCoordinationListenerDelegate(const FileCoordinationServicer::Surroundings& surroundings) : surroundings_(surroundings) {}

  bool listener(QXRpcListener& listener, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) override;

 private:
  const FileCoordinationServicer::Surroundings surroundings_;
};

}  // namespace docuvend::linux_platform
