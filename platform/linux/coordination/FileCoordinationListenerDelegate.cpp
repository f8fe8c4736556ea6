#include "platform/linux/coordination/FileCoordinationListenerDelegate.h"

#include "platform/linux/wire/FileCoordinationProtocol.h"

namespace docuvend::linux_platform {

bool FileCoordinationListenerDelegate::listener(QXRpcListener& /*listener*/,
                                                const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) {
  qxServe<QXFileCoordination>(*shouldAcceptNewConnection,
                              std::make_shared<FileCoordinationServicer>(surroundings_, shouldAcceptNewConnection));
  return true;
}

}  // namespace docuvend::linux_platform
