// Accepts the clients of "com.orvane.Docuvend": every one of them, each with a servicer of its own that the connection keeps alive. Who
// may do what is decided request by request.
//
// Called on the listener's own context.
#pragma once

#include <memory>

#include "platform/rpc.h"

namespace docuvend {

class DVServer;

class DVRpcListenerDelegate final : public QXRpcListenerDelegate {
 public:
  explicit DVRpcListenerDelegate(std::weak_ptr<DVServer> server) : server_(std::move(server)) {}

  // Null when it has gone away.
  [[nodiscard]] std::shared_ptr<DVServer> server() const { return server_.lock(); }

  // Always true.
  bool listener(QXRpcListener& listener, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) override;

 private:
  const std::weak_ptr<DVServer> server_;
};

}  // namespace docuvend
