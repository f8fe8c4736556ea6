// RPC in memory: the test is the peer.
//
// Where it differs from the real one:
//  - Nothing is encoded: there is no size limit, no text is refused, and descriptors are passed as they are.
//  - There are no threads of its own. A request runs on the thread of the test that makes it (or that resumes the connection); an answer
//    runs the reply handler inside `answer`. Requests of one connection still run one after another: one made while another runs waits.
//  - A delegate is called inside `connect` or `resume`, whichever comes last.
//  - The peer's identity is what the test says it is. There is no limit on connections or waiting messages.
//  - Two listeners for one name are two listeners; nothing ends the process.
#pragma once

#include <cstddef>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/rpc.h"

namespace docuvend::fake_platform {

// Hears of calls in the order in which they are made, by their names ("setExportedInterface", "resume"). Give the same one to several
// fakes to see the order between them.
using FakeRecorder = std::function<void(const std::string& call)>;

// Records what is sent; the test answers.
class FakeRpcProxy final : public QXRpcProxy {
 public:
  struct Send {
    QXRpcOperation operation;
    QXArray arguments;
    bool wantsReply = false;
    bool settled = false;  // answered or failed
  };

  explicit FakeRpcProxy(QXErrorHandler errorHandler) : errorHandler_(std::move(errorHandler)) {}

  void send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) override;

  [[nodiscard]] std::size_t count() const;
  [[nodiscard]] Send sent(std::size_t index) const;
  [[nodiscard]] std::vector<std::string> sentNames() const;

  // Settles one message, counted from 0 in the order of sending. False when it does not exist, is settled already, or (an answer) wants
  // no reply, and nothing happens then. An answer that does not fit the operation reaches the error handler.
  bool answer(std::size_t index, QXArray values);
  bool fail(std::size_t index, const QXError& error);
  // The connection ended: every message that waits for its answer fails once.
  void failAll(const QXError& error);

 private:
  struct Entry {
    Send send;
    QXRpcReply reply;
  };
  std::optional<Entry> settle(std::size_t index);

  const QXErrorHandler errorHandler_;
  mutable std::mutex mutex_;
  std::vector<Entry> entries_;
};

// The daemon's side of a connection, and the test's handle on the peer.
class FakeRpcConnection final : public QXRpcConnection, public std::enable_shared_from_this<FakeRpcConnection> {
 public:
  [[nodiscard]] static std::shared_ptr<FakeRpcConnection> create() { return std::make_shared<FakeRpcConnection>(); }

  void setExportedInterface(QXRpcInterface interface) override;
  void setExportedObject(std::shared_ptr<QXRpcExportedObject> object) override;
  void resume() override;
  [[nodiscard]] int processIdentifier() const override;
  [[nodiscard]] QXAuditToken auditToken() const override;
  [[nodiscard]] std::optional<QXValue> valueForEntitlement(const std::string& name) const override;
  [[nodiscard]] std::shared_ptr<QXRpcProxy> remoteObjectProxy(QXErrorHandler errorHandler) override;

  // Who the peer is.
  void setProcessIdentifier(int processIdentifier);
  void setAuditToken(const QXAuditToken& token);
  void setEntitlement(const std::string& name, QXValue value);
  // Hears "setExportedInterface", "setExportedObject", "resume" and "remoteObjectProxy".
  void setRecorder(FakeRecorder recorder);

  [[nodiscard]] std::optional<QXRpcInterface> exportedInterface() const;
  [[nodiscard]] std::shared_ptr<QXRpcExportedObject> exportedObject() const;
  [[nodiscard]] int resumeCount() const;
  [[nodiscard]] bool isResumed() const { return resumeCount() > 0; }
  [[nodiscard]] bool isClosed() const;
  // The proxies that were asked for, in order.
  [[nodiscard]] std::vector<std::shared_ptr<FakeRpcProxy>> proxies() const;

  // Sends a request as the peer would; it waits until the connection is resumed. An empty `reply` asks for no answer. `failure` hears of
  // an unknown operation, wrong arguments, an answer that does not fit, and the end of the connection before the answer.
  void invoke(const std::string& operationName, QXArray arguments, QXRpcReply reply, QXErrorHandler failure = {});
  // The peer's proxy: QXRemote<P>(connection->peer(handler)).call<&P::operation>(...) makes `invoke` calls.
  [[nodiscard]] std::shared_ptr<QXRpcProxy> peer(QXErrorHandler errorHandler = {});
  // The peer leaves: waiting messages of both directions fail, and the exported object is released.
  void close(const QXError& reason = QXError::system(104, "the peer left"));

 private:
  // One message of the peer: exactly one of its two handlers runs, once.
  struct Invocation {
    std::string operationName;
    QXArray arguments;
    QXRpcReply reply;
    QXErrorHandler failure;
    bool settled = false;
  };
  void runWaiting();
  void run(const std::shared_ptr<Invocation>& invocation);
  void complete(const std::shared_ptr<Invocation>& invocation, const QXRpcInterface& interface, std::size_t operation, QXArray values);
  bool settle(const std::shared_ptr<Invocation>& invocation);
  void fail(const std::shared_ptr<Invocation>& invocation, const QXError& error);
  void record(const char* call) const;

  mutable std::mutex mutex_;
  FakeRecorder recorder_;
  int processIdentifier_ = 0;
  QXAuditToken token_;
  std::map<std::string, QXValue> entitlements_;
  std::optional<QXRpcInterface> interface_;
  std::shared_ptr<QXRpcExportedObject> object_;
  int resumeCount_ = 0;
  std::optional<QXError> closed_;
  bool running_ = false;
  std::deque<std::shared_ptr<Invocation>> waiting_;      // not given to the object yet
  std::vector<std::shared_ptr<Invocation>> unanswered_;  // all that are not settled
  std::vector<std::shared_ptr<FakeRpcProxy>> proxies_;
};

class FakeRpcListener final : public QXRpcListener {
 public:
  void setDelegate(std::weak_ptr<QXRpcListenerDelegate> delegate) override;
  void resume() override;

  // Hears "setDelegate" and "resume".
  void setRecorder(FakeRecorder recorder);
  [[nodiscard]] std::shared_ptr<QXRpcListenerDelegate> delegate() const;
  [[nodiscard]] int resumeCount() const;
  [[nodiscard]] bool isResumed() const { return resumeCount() > 0; }

  // A client connects: it is handed to the delegate, now or when the listener is resumed. Without a delegate, or when the delegate
  // refuses it, the connection is closed.
  void connect(std::shared_ptr<FakeRpcConnection> connection);

 private:
  void deliver(const std::shared_ptr<FakeRpcConnection>& connection);

  mutable std::mutex mutex_;
  FakeRecorder recorder_;
  std::weak_ptr<QXRpcListenerDelegate> delegate_;
  int resumeCount_ = 0;
  std::vector<std::shared_ptr<FakeRpcConnection>> waiting_;
};

class FakeRpcService final : public QXRpcService {
 public:
  [[nodiscard]] std::shared_ptr<QXRpcListener> listenerForService(const std::string& name) override;

  // Hears "listenerForService:NAME"; listeners made later hear through it too.
  void setRecorder(FakeRecorder recorder);
  // The latest listener for that name, else null. The service keeps its listeners alive.
  [[nodiscard]] std::shared_ptr<FakeRpcListener> listener(const std::string& name) const;
  // The names in the order of creation, one for each listener.
  [[nodiscard]] std::vector<std::string> createdNames() const;

 private:
  mutable std::mutex mutex_;
  FakeRecorder recorder_;
  std::map<std::string, std::shared_ptr<FakeRpcListener>> listeners_;
  std::vector<std::string> createdNames_;
};

}  // namespace docuvend::fake_platform
