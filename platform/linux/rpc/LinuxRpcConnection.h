// A connection over a Unix stream socket, with the peer's identity.
//
// When the peer misbehaves the connection is closed with one log line that says who and why. All operations may be used from any thread.
#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/identity/PeerIdentity.h"
#include "platform/linux/wire/CallRules.h"
#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/log.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

class LinuxRpcConnection final : public QXRpcConnection, public std::enable_shared_from_this<LinuxRpcConnection> {
 public:
  using EndHandler = std::function<void(const QXError& reason)>;

  // A peer that a listener accepted. A bundle that it declares in its hello is put to the directory; a refusal ends the connection. `onEnd`
  // is called once, on a thread of the reactor; the directory and the log outlive the reactor's threads. Requests count in
  // the rules' budget until they are answered, also when the connection ends before.
  [[nodiscard]] static std::shared_ptr<LinuxRpcConnection> create(Reactor& reactor, PeerDirectory& peers, QXLogHandle& log,
                                                                  std::shared_ptr<const PeerIdentity> peer, UniqueDescriptor socket,
                                                                  CallRules rules, std::optional<std::string> straightBelow,
                                                                  EndHandler onEnd);

  void setExportedInterface(QXRpcInterface interface) override;
  void setExportedObject(std::shared_ptr<QXRpcExportedObject> object) override;
  void resume() override;
  [[nodiscard]] int processIdentifier() const override;
  [[nodiscard]] QXAuditToken auditToken() const override;
  [[nodiscard]] std::optional<QXValue> valueForEntitlement(const std::string& name) const override;
  // The proxy keeps the socket's end alive, not this object.
  [[nodiscard]] std::shared_ptr<QXRpcProxy> remoteObjectProxy(QXErrorHandler errorHandler) override;

  // Ends the connection and tells the peer why.
  void close(const QXError& reason);

 private:
  LinuxRpcConnection(std::shared_ptr<const PeerIdentity> peer, std::optional<std::string> straightBelow)
      : straightBelow_(std::move(straightBelow)), peer_(std::move(peer)) {}
  [[nodiscard]] std::optional<QXError> peerSaidHello(PeerDirectory& peers, const Hello& hello);
  [[nodiscard]] std::shared_ptr<const PeerIdentity> peer() const;

  const std::optional<std::string> straightBelow_;
  std::shared_ptr<Endpoint> endpoint_;  // constant after creation

  mutable std::mutex mutex_;
  std::shared_ptr<const PeerIdentity> peer_;  // guarded by mutex_, never null; a declaration replaces it
};

}  // namespace docuvend::linux_platform
