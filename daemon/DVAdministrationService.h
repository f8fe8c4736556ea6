// Publishes the named service "com.orvane.Administration". Each of its clients has an administrator of its own, which the connection keeps
// alive. Who becomes a client is the platform's to decide, which knows whom the service is for.
//
// Belongs to a shared_ptr; lives until the process ends.
#pragma once

#include <memory>

#include "platform/rpc.h"

namespace docuvend {

class DVAdministrationService final : public QXRpcListenerDelegate, public std::enable_shared_from_this<DVAdministrationService> {
 public:
  // Called once. Clients are accepted from then on, also while the device is locked and while the providers are being registered: a
  // provider that hangs does not keep its administrator out.
  void start();

  // Always true. Called on the listener's own context.
  bool listener(QXRpcListener& listener, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) override;

 private:
  std::shared_ptr<QXRpcListener> listener_;  // null until `start`
};

}  // namespace docuvend
