#include "platform/linux/coordination/FileCoordinationListenerDelegate.h"

#include "platform/linux/coordination/FileCoordinationServicer.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"

namespace docuvend::linux_platform {

bool FileCoordinationListenerDelegate::listener(QXRpcListener& /*listener*/,
                                                const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) {
  qxServe<QXFileCoordination>(*shouldAcceptNewConnection,
                              std::make_shared<FileCoordinationServicer>(coordinator_, sandbox_, shouldAcceptNewConnection));
  return true;
}

}  // namespace docuvend::linux_platform
