#include "platform/linux/rpc/LinuxRpcConnection.h"

#include <utility>

#include "platform/QXLogMessage.h"
#include "platform/linux/rpc/StraightURLs.h"

namespace docuvend::linux_platform {
namespace {

Endpoint::Handlers handlersFor(QXLogHandle& log, int loggedProcess, LogSubject::Name subject, LinuxRpcConnection::EndHandler onEnd) {
  Endpoint::Handlers handlers;
  handlers.onMisbehaviour = [&log, loggedProcess, name = subject](const QXError& reason) {
    const LogSubject subject(name);
    const auto text = reason.texts.find("description");
    qxLog(log, "[NOTICE] Closing the connection of PID %d: %@", loggedProcess,
          text == reason.texts.end() ? reason.description() : text->second);
  };
  handlers.onDescriptorsRefused = [&log, loggedProcess, name = std::move(subject)] {
    const LogSubject subject(name);
    qxLog(log, "[ERROR] PID %d was not given an open file: too many of this user's lie unread in sockets.", loggedProcess);
  };
  handlers.onClose = std::move(onEnd);
  return handlers;
}

}  // namespace

std::shared_ptr<LinuxRpcConnection> LinuxRpcConnection::create(Reactor& reactor, PeerDirectory& peers, QXLogHandle& log,
                                                               std::shared_ptr<const PeerIdentity> peer, UniqueDescriptor socket,
                                                               CallRules rules, std::optional<std::string> straightBelow,
                                                               EndHandler onEnd) {
  auto handlers = handlersFor(log, peer->pid, rules.subject, std::move(onEnd));
  std::shared_ptr<LinuxRpcConnection> connection(new LinuxRpcConnection(std::move(peer), std::move(straightBelow)));
  handlers.onHello = [&peers, weak = std::weak_ptr(connection)](const Hello& hello) -> std::optional<QXError> {
    const auto strongSelf = weak.lock();
    return strongSelf ? strongSelf->peerSaidHello(peers, hello) : std::nullopt;
  };
  connection->endpoint_ = Endpoint::create(reactor, std::move(socket), Hello{}, std::move(handlers), std::move(rules));
  return connection;
}

std::optional<QXError> LinuxRpcConnection::peerSaidHello(PeerDirectory& peers, const Hello& hello) {
  if (!hello.declaredBundle) return std::nullopt;
  auto declared = peers.declare(*peer(), *hello.declaredBundle);
  if (!declared) {
    return qxRpcError(QXRpcErrorCode::refused, "this process cannot act for the bundle " + *hello.declaredBundle);
  }
  const std::lock_guard lock(mutex_);
  peer_.swap(declared);
  return std::nullopt;
}

std::shared_ptr<const PeerIdentity> LinuxRpcConnection::peer() const {
  const std::lock_guard lock(mutex_);
  return peer_;
}

void LinuxRpcConnection::setExportedInterface(QXRpcInterface interface) { endpoint_->setExportedInterface(std::move(interface)); }

void LinuxRpcConnection::setExportedObject(std::shared_ptr<QXRpcExportedObject> object) {
  endpoint_->setExportedObject(straightBelow_ ? withStraightArguments(std::move(object), *straightBelow_) : std::move(object));
}

void LinuxRpcConnection::resume() { endpoint_->resume(); }

int LinuxRpcConnection::processIdentifier() const { return peer()->pid; }

QXAuditToken LinuxRpcConnection::auditToken() const { return peer()->token; }

std::optional<QXValue> LinuxRpcConnection::valueForEntitlement(const std::string& name) const {
  const auto known = peer();
  if (known->standing == Standing::nobody) return std::nullopt;
  const auto found = known->entitlements.find(name);
  if (found == known->entitlements.end()) return std::nullopt;
  return found->second;
}

std::shared_ptr<QXRpcProxy> LinuxRpcConnection::remoteObjectProxy(QXErrorHandler errorHandler) {
  return endpoint_->remoteObjectProxy(std::move(errorHandler));
}

void LinuxRpcConnection::close(const QXError& reason) { endpoint_->closeOnReadingThread(reason); }

}  // namespace docuvend::linux_platform
