// One end of an RPC connection over a Unix stream socket: frames in and out, requests to an exported object, replies to those who wait.
//
// The thread of the reactor that reads a request runs it; one connection's requests run one after another. While a request or a reply
// handler runs, nothing else is read from that connection: a handler must not wait for an answer that comes over its own connection.
// Writing never waits. The process at the other end is not trusted: everything that it controls is bounded (Limits.h), and a malformed
// frame ends the connection. A ping is answered here, without reaching any object.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <variant>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/CallRules.h"
#include "platform/linux/wire/Frame.h"
#include "platform/linux/wire/OutgoingCalls.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/rpc.h"
#include "platform/rpc_errors.h"

namespace docuvend::linux_platform {

class Endpoint : public std::enable_shared_from_this<Endpoint> {
 public:
  struct Handlers {
    // The peer's first frame arrived, before any request. An error ends the connection with it. May be empty.
    std::function<std::optional<QXError>(const Hello&)> onHello;
    // This end closes the connection for what the peer did: bytes that are no frame, a version that is not spoken here, not reading. Before
    // onClose. May be empty.
    std::function<void(const QXError&)> onMisbehaviour;
    // An answer with descriptors could not be sent, as too many of this user's lie in sockets unread: the peer is told that its request
    // failed, and the connection goes on. On a thread of the reactor. May be empty.
    std::function<void()> onDescriptorsRefused;
    // The connection is over, once, after the messages that waited have failed: why, or an error of ECONNRESET kind when the peer left.
    // Also called after `close` and when the endpoint is released; on a thread of the reactor. May be empty.
    std::function<void(const QXError&)> onClose;
  };

  // Takes a connected socket and sends the hello; its version is put in when it is 0. Nothing is read before `resume`. The endpoint lives
  // as long as its owner holds it: released, it closes the connection.
  [[nodiscard]] static std::shared_ptr<Endpoint> create(Reactor& reactor, UniqueDescriptor socket, Hello hello, Handlers handlers,
                                                        CallRules rules = {});
  ~Endpoint();
  Endpoint(const Endpoint&) = delete;
  Endpoint& operator=(const Endpoint&) = delete;

  // Before `resume`. Without an exported object every request is answered with "unknown operation". The object is let go when the
  // connection is over.
  void setExportedInterface(QXRpcInterface interface);
  void setExportedObject(std::shared_ptr<QXRpcExportedObject> object);
  void resume();

  // Each failed message calls the handler once. A message fails at once, and may be tried again later, when too many wait for their answers
  // or too many bytes for the peer to take them. Keeps the endpoint alive.
  [[nodiscard]] std::shared_ptr<QXRpcProxy> remoteObjectProxy(QXErrorHandler errorHandler);
  // The same, for those whom it concerns how far a failed message came.
  [[nodiscard]] std::shared_ptr<QXRpcProxy> remoteObjectProxy(FailureHandler failureHandler);

  // Asks the other end for a sign of life, which its reading thread gives between two requests, whatever became of those before. The
  // handler runs when it comes; it is dropped when the connection ends first. Not while an earlier one is awaited.
  void ping(std::function<void()> onPong);
  // True while a message waits for its answer.
  [[nodiscard]] bool awaitsAnswers() const;

  // Ends the connection and tells the peer why; messages that wait for an answer fail. Waits for nothing and calls no handler itself.
  void close(const QXError& reason);
  // The same, but the exported object is let go of on the reading thread, when what runs there now is done: its end may take long.
  void closeOnReadingThread(const QXError& reason);

 private:
  class State;
  class Proxy;
  explicit Endpoint(std::shared_ptr<State> state);

  const std::shared_ptr<State> state_;
};

}  // namespace docuvend::linux_platform
