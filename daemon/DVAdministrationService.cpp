#include "daemon/DVAdministrationService.h"

#include "daemon/DVAdministrator.h"
#include "platform/QXPlatform.h"
#include "platform/rpc_protocol.h"
#include "service/DVAdministration.h"

namespace docuvend {

void DVAdministrationService::start() {
  listener_ = QXPlatform::current().rpc.listenerForService(kDVAdministrationServiceName);
  listener_->setDelegate(weak_from_this());
  listener_->resume();
}

bool DVAdministrationService::listener(QXRpcListener& /*listener*/, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) {
  qxServe<DVAdministration>(*shouldAcceptNewConnection, std::make_shared<DVAdministrator>(shouldAcceptNewConnection));
  return true;
}

}  // namespace docuvend
