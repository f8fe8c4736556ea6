#include "daemon/DVRpcListenerDelegate.h"

#include "common/DVLog.h"
#include "daemon/DVServer.h"
#include "service/DVDaemon.h"
#include "service/DVRequests.h"
#include "service/DVRpcServicer.h"

namespace docuvend {
namespace {

constexpr std::size_t kProvidersPosition = 1;  // in the reply of providersCompletionHandler:

QXRpcInterface daemonInterface() {
  QXRpcInterface interface = qxInterfaceOf<DVDaemon>();
  interface.setAcceptedReplyKinds(dvOperationName<&DVDaemon::providersCompletionHandler>(), kProvidersPosition,
                                  {QXValueKind::dictionary, QXValueKind::string, QXValueKind::url});
  return interface;
}

}  // namespace

bool DVRpcListenerDelegate::listener(QXRpcListener&, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) {
  const auto servicer = std::make_shared<DVRpcServicer>(server(), shouldAcceptNewConnection);
  qxServe<DVDaemon>(*shouldAcceptNewConnection, servicer, daemonInterface());
  dvLog("[INFO] New connection accepted.");
  return true;
}

}  // namespace docuvend
