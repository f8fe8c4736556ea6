// One end of an RPC connection over a Unix stream socket: frames in and out, requests to an exported object, replies to those who wait.
//
// The thread of the reactor that reads a request runs it; one connection's requests run one after another. The process at the other end is
// not trusted: everything that it controls is bounded, and a malformed frame ends the connection.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <variant>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

// The first frame of each direction.
struct Hello {
  std::uint32_t version = 0;
  std::optional<std::string> declaredBundle;  // an unconfined client: the bundle that it acts for
};

class Endpoint : public std::enable_shared_from_this<Endpoint> {
 public:
  struct Handlers {
    // The peer's first frame arrived, before any request. An error ends the connection with it. May be empty.
    std::function<std::optional<QXError>(const Hello&)> onHello;
    // The connection is over, once: why, or an error of ECONNRESET kind when the peer left. May be empty.
    std::function<void(const QXError&)> onClose;
  };

  // Takes a connected socket. Nothing is read before `resume`.
  [[nodiscard]] static std::shared_ptr<Endpoint> create(Reactor& reactor, UniqueDescriptor socket, Hello hello, Handlers handlers);
  ~Endpoint();

  // Before `resume`. Without an exported object every request is answered with "unknown operation".
  void setExportedInterface(QXRpcInterface interface);
  void setExportedObject(std::shared_ptr<QXRpcExportedObject> object);
  void resume();

  // Each failed message calls the handler once. Keeps the endpoint alive.
  [[nodiscard]] std::shared_ptr<QXRpcProxy> remoteObjectProxy(QXErrorHandler errorHandler);

  // Ends the connection; messages that wait for an answer fail.
  void close(const QXError& reason);

 private:
  struct State;
  explicit Endpoint(std::unique_ptr<State> state);
  std::unique_ptr<State> state_;
};

// Connects to a named service's socket.
[[nodiscard]] std::variant<UniqueDescriptor, QXError> connectToSocket(const std::string& path);

}  // namespace docuvend::linux_platform
