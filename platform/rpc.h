// Named-service RPC: a listener for a name, connections, and the operations of a protocol sent over them.
//
// Guarantees of every implementation:
//  - Requests of one connection reach its exported object one after another, on that connection's own serial context; connections
//    run beside each other.
//  - A request whose argument count or kinds differ from the exported interface never reaches the object; the peer's error handler hears.
//  - Of a message's reply handler and its error handler exactly one runs, once, or none if the peer lives and never answers. The first
//    call of a reply that was handed to an exported object wins, later ones are dropped, and never calling it is legal.
//  - Handlers run on a thread of the RPC layer, never inside the call that sent the message.
#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/QXValue.h"

namespace docuvend {

// Identifies the process at the other end, also after its process identifier was given to another. All zero: nobody.
struct QXAuditToken {
  std::array<std::uint8_t, 32> bytes{};
  friend auto operator<=>(const QXAuditToken&, const QXAuditToken&) = default;
};

// One operation as the wire sees it. Any argument or reply value may be absent; one that is present has the kind given here.
struct QXRpcOperation {
  std::string name;  // the full keyword name
  std::vector<QXValueKind> arguments;
  std::vector<QXValueKind> replies;
};

// What a connection exports, built from a protocol's table (platform/rpc_protocol.h).
class QXRpcInterface {
 public:
  QXRpcInterface(std::string protocolName, std::vector<QXRpcOperation> operations)
      : protocolName_(std::move(protocolName)), operations_(std::move(operations)) {}

  [[nodiscard]] const std::string& protocolName() const { return protocolName_; }
  [[nodiscard]] const std::vector<QXRpcOperation>& operations() const { return operations_; }
  [[nodiscard]] std::optional<std::size_t> indexOf(std::string_view operationName) const;

  // From now on, every value at that reply position, and every value inside it, must be of one of these kinds.
  void setAcceptedReplyKinds(std::string_view operationName, std::size_t position, std::vector<QXValueKind> kinds);
  // None when the position is not restricted.
  [[nodiscard]] const std::vector<QXValueKind>* acceptedReplyKinds(std::string_view operationName, std::size_t position) const;
  [[nodiscard]] std::size_t restrictionCount() const { return restrictions_.size(); }

 private:
  struct Restriction {
    std::string operationName;
    std::size_t position;
    std::vector<QXValueKind> kinds;
  };

  std::string protocolName_;
  std::vector<QXRpcOperation> operations_;
  std::vector<Restriction> restrictions_;
};

// None when the values fit the kinds (count and, where present, kind), else what is wrong, in words.
[[nodiscard]] std::optional<std::string> qxMismatch(const std::vector<QXValueKind>& kinds, const QXArray& values);
// None when the reply fits the operation and its restrictions, else what is wrong.
[[nodiscard]] std::optional<std::string> qxReplyMismatch(const QXRpcInterface& interface, std::size_t operation, const QXArray& values);

using QXRpcReply = std::function<void(QXArray)>;
using QXErrorHandler = std::function<void(const QXError&)>;

// The receiving end of an interface. `reply` is empty, or leads nowhere, when the peer wants none.
class QXRpcExportedObject {
 public:
  QXRpcExportedObject() = default;
  QXRpcExportedObject(const QXRpcExportedObject&) = delete;
  QXRpcExportedObject& operator=(const QXRpcExportedObject&) = delete;
  virtual ~QXRpcExportedObject() = default;

  // `operation` is an index into the exported interface; the arguments have been checked against it.
  virtual void invoke(std::size_t operation, QXArray arguments, QXRpcReply reply) = 0;
};

// The sending end. May be used from any thread.
class QXRpcProxy {
 public:
  QXRpcProxy() = default;
  QXRpcProxy(const QXRpcProxy&) = delete;
  QXRpcProxy& operator=(const QXRpcProxy&) = delete;
  virtual ~QXRpcProxy() = default;

  // Sends one message. Failure to deliver it, or the end of the connection before its answer, reaches the proxy's error handler.
  // An empty `reply` asks for no answer.
  virtual void send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) = 0;
};

class QXRpcConnection {
 public:
  QXRpcConnection() = default;
  QXRpcConnection(const QXRpcConnection&) = delete;
  QXRpcConnection& operator=(const QXRpcConnection&) = delete;
  virtual ~QXRpcConnection() = default;

  virtual void setExportedInterface(QXRpcInterface interface) = 0;
  virtual void setExportedObject(std::shared_ptr<QXRpcExportedObject> object) = 0;
  // Nothing is read before this.
  virtual void resume() = 0;

  // The peer, as it was when it connected.
  [[nodiscard]] virtual int processIdentifier() const = 0;
  [[nodiscard]] virtual QXAuditToken auditToken() const = 0;
  [[nodiscard]] virtual std::optional<QXValue> valueForEntitlement(const std::string& name) const = 0;

  // Each failed message calls the handler once.
  [[nodiscard]] virtual std::shared_ptr<QXRpcProxy> remoteObjectProxy(QXErrorHandler errorHandler) = 0;
};

class QXRpcListener;

class QXRpcListenerDelegate {
 public:
  QXRpcListenerDelegate() = default;
  QXRpcListenerDelegate(const QXRpcListenerDelegate&) = delete;
  QXRpcListenerDelegate& operator=(const QXRpcListenerDelegate&) = delete;
  virtual ~QXRpcListenerDelegate() = default;

  // listener:shouldAcceptNewConnection: — called on the listener's own serial context. False ends the connection.
  virtual bool listener(QXRpcListener& listener, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) = 0;
};

// Clients of the name can connect from the listener's creation on; they are accepted from `resume` on.
class QXRpcListener {
 public:
  QXRpcListener() = default;
  QXRpcListener(const QXRpcListener&) = delete;
  QXRpcListener& operator=(const QXRpcListener&) = delete;
  virtual ~QXRpcListener() = default;

  // The delegate belongs to the caller.
  virtual void setDelegate(std::weak_ptr<QXRpcListenerDelegate> delegate) = 0;
  virtual void resume() = 0;
};

class QXRpcService {
 public:
  QXRpcService() = default;
  QXRpcService(const QXRpcService&) = delete;
  QXRpcService& operator=(const QXRpcService&) = delete;
  virtual ~QXRpcService() = default;

  // Never fails: a name that cannot be published is a fault of the installation, logged by the platform, which then ends the process.
  [[nodiscard]] virtual std::shared_ptr<QXRpcListener> listenerForService(const std::string& name) = 0;
};

}  // namespace docuvend
