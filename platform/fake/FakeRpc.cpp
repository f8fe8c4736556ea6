#include "platform/fake/FakeRpc.h"

#include <algorithm>
#include <utility>

#include "platform/rpc_errors.h"

namespace docuvend::fake_platform {
namespace {

class Peer final : public QXRpcProxy {
 public:
  Peer(std::shared_ptr<FakeRpcConnection> connection, QXErrorHandler errorHandler)
      : connection_(std::move(connection)), errorHandler_(std::move(errorHandler)) {}

  void send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) override {
    connection_->invoke(operation.name, std::move(arguments), std::move(reply), errorHandler_);
  }

 private:
  const std::shared_ptr<FakeRpcConnection> connection_;
  const QXErrorHandler errorHandler_;
};

}  // namespace

void FakeRpcProxy::send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) {
  const std::lock_guard lock(mutex_);
  const bool wantsReply = static_cast<bool>(reply);
  entries_.push_back({{operation, std::move(arguments), wantsReply}, std::move(reply)});
}

std::size_t FakeRpcProxy::count() const {
  const std::lock_guard lock(mutex_);
  return entries_.size();
}

FakeRpcProxy::Send FakeRpcProxy::sent(std::size_t index) const {
  const std::lock_guard lock(mutex_);
  return entries_.at(index).send;
}

std::vector<std::string> FakeRpcProxy::sentNames() const {
  const std::lock_guard lock(mutex_);
  std::vector<std::string> names;
  for (const Entry& entry : entries_) names.push_back(entry.send.operation.name);
  return names;
}

std::optional<FakeRpcProxy::Entry> FakeRpcProxy::settle(std::size_t index) {
  const std::lock_guard lock(mutex_);
  if (index >= entries_.size() || entries_[index].send.settled) return std::nullopt;
  entries_[index].send.settled = true;
  return Entry{entries_[index].send, std::move(entries_[index].reply)};
}

bool FakeRpcProxy::answer(std::size_t index, QXArray values) {
  if (index < count() && !sent(index).wantsReply) return false;
  const auto entry = settle(index);
  if (!entry) return false;
  if (const auto mismatch = qxMismatch(entry->send.operation.replies, values)) {
    if (errorHandler_) errorHandler_(qxRpcError(QXRpcErrorCode::invalidReply, *mismatch));
    return true;
  }
  entry->reply(std::move(values));
  return true;
}

bool FakeRpcProxy::fail(std::size_t index, const QXError& error) {
  if (!settle(index)) return false;
  if (errorHandler_) errorHandler_(error);
  return true;
}

void FakeRpcProxy::failAll(const QXError& error) {
  for (std::size_t i = 0; i < count(); ++i) {
    if (sent(i).wantsReply) fail(i, error);
  }
}

void FakeRpcConnection::record(const char* call) const {
  FakeRecorder recorder;
  {
    const std::lock_guard lock(mutex_);
    recorder = recorder_;
  }
  if (recorder) recorder(call);
}

void FakeRpcConnection::setExportedInterface(QXRpcInterface interface) {
  record("setExportedInterface");
  const std::lock_guard lock(mutex_);
  interface_ = std::move(interface);
}

void FakeRpcConnection::setExportedObject(std::shared_ptr<QXRpcExportedObject> object) {
  record("setExportedObject");
  const std::lock_guard lock(mutex_);
  object_ = std::move(object);
}

void FakeRpcConnection::resume() {
  record("resume");
  {
    const std::lock_guard lock(mutex_);
    ++resumeCount_;
  }
  runWaiting();
}

int FakeRpcConnection::processIdentifier() const {
  const std::lock_guard lock(mutex_);
  return processIdentifier_;
}

QXAuditToken FakeRpcConnection::auditToken() const {
  const std::lock_guard lock(mutex_);
  return token_;
}

std::optional<QXValue> FakeRpcConnection::valueForEntitlement(const std::string& name) const {
  const std::lock_guard lock(mutex_);
  const auto found = entitlements_.find(name);
  if (found == entitlements_.end()) return std::nullopt;
  return found->second;
}

std::shared_ptr<QXRpcProxy> FakeRpcConnection::remoteObjectProxy(QXErrorHandler errorHandler) {
  record("remoteObjectProxy");
  auto proxy = std::make_shared<FakeRpcProxy>(std::move(errorHandler));
  const std::lock_guard lock(mutex_);
  proxies_.push_back(proxy);
  return proxy;
}

void FakeRpcConnection::setProcessIdentifier(int processIdentifier) {
  const std::lock_guard lock(mutex_);
  processIdentifier_ = processIdentifier;
}

void FakeRpcConnection::setAuditToken(const QXAuditToken& token) {
  const std::lock_guard lock(mutex_);
  token_ = token;
}

void FakeRpcConnection::setEntitlement(const std::string& name, QXValue value) {
  const std::lock_guard lock(mutex_);
  entitlements_[name] = std::move(value);
}

void FakeRpcConnection::setRecorder(FakeRecorder recorder) {
  const std::lock_guard lock(mutex_);
  recorder_ = std::move(recorder);
}

std::optional<QXRpcInterface> FakeRpcConnection::exportedInterface() const {
  const std::lock_guard lock(mutex_);
  return interface_;
}

std::shared_ptr<QXRpcExportedObject> FakeRpcConnection::exportedObject() const {
  const std::lock_guard lock(mutex_);
  return object_;
}

int FakeRpcConnection::resumeCount() const {
  const std::lock_guard lock(mutex_);
  return resumeCount_;
}

bool FakeRpcConnection::isClosed() const {
  const std::lock_guard lock(mutex_);
  return closed_.has_value();
}

std::vector<std::shared_ptr<FakeRpcProxy>> FakeRpcConnection::proxies() const {
  const std::lock_guard lock(mutex_);
  return proxies_;
}

std::shared_ptr<QXRpcProxy> FakeRpcConnection::peer(QXErrorHandler errorHandler) {
  return std::make_shared<Peer>(shared_from_this(), std::move(errorHandler));
}

void FakeRpcConnection::invoke(const std::string& operationName, QXArray arguments, QXRpcReply reply, QXErrorHandler failure) {
  auto invocation = std::make_shared<Invocation>();
  invocation->operationName = operationName;
  invocation->arguments = std::move(arguments);
  invocation->reply = std::move(reply);
  invocation->failure = std::move(failure);
  std::optional<QXError> closed;
  {
    const std::lock_guard lock(mutex_);
    closed = closed_;
    unanswered_.push_back(invocation);
    if (!closed) waiting_.push_back(invocation);
  }
  if (closed) {
    fail(invocation, *closed);
  } else {
    runWaiting();
  }
}

void FakeRpcConnection::runWaiting() {
  std::unique_lock lock(mutex_);
  if (running_ || resumeCount_ == 0) return;
  running_ = true;
  while (!waiting_.empty()) {
    const auto next = std::move(waiting_.front());
    waiting_.pop_front();
    lock.unlock();
    run(next);
    lock.lock();
  }
  running_ = false;
}

void FakeRpcConnection::run(const std::shared_ptr<Invocation>& invocation) {
  const auto interface = exportedInterface();
  const auto object = exportedObject();
  const auto operation = interface && object ? interface->indexOf(invocation->operationName) : std::nullopt;
  if (!operation) {
    fail(invocation, qxRpcError(QXRpcErrorCode::unknownOperation, "unknown operation " + invocation->operationName));
    return;
  }
  if (const auto mismatch = qxMismatch(interface->operations()[*operation].arguments, invocation->arguments)) {
    fail(invocation, qxRpcError(QXRpcErrorCode::invalidArguments, *mismatch));
    return;
  }
  QXRpcReply reply;
  if (invocation->reply) {
    reply = [self = weak_from_this(), invocation, interface = *interface, operation = *operation](QXArray values) {
      if (const auto connection = self.lock()) connection->complete(invocation, interface, operation, std::move(values));
    };
  } else {
    settle(invocation);
  }
  object->invoke(*operation, std::move(invocation->arguments), std::move(reply));
}

void FakeRpcConnection::complete(const std::shared_ptr<Invocation>& invocation, const QXRpcInterface& interface, std::size_t operation,
                                 QXArray values) {
  if (const auto mismatch = qxReplyMismatch(interface, operation, values)) {
    fail(invocation, qxRpcError(QXRpcErrorCode::invalidReply, *mismatch));
    return;
  }
  if (settle(invocation)) invocation->reply(std::move(values));
}

bool FakeRpcConnection::settle(const std::shared_ptr<Invocation>& invocation) {
  const std::lock_guard lock(mutex_);
  if (std::exchange(invocation->settled, true)) return false;
  unanswered_.erase(std::find(unanswered_.begin(), unanswered_.end(), invocation));
  return true;
}

void FakeRpcConnection::fail(const std::shared_ptr<Invocation>& invocation, const QXError& error) {
  if (settle(invocation) && invocation->failure) invocation->failure(error);
}

void FakeRpcConnection::close(const QXError& reason) {
  std::vector<std::shared_ptr<Invocation>> unanswered;
  std::vector<std::shared_ptr<FakeRpcProxy>> proxies;
  std::shared_ptr<QXRpcExportedObject> released;
  {
    const std::lock_guard lock(mutex_);
    if (closed_) return;
    closed_ = reason;
    waiting_.clear();
    unanswered = unanswered_;
    proxies = proxies_;
    released = std::move(object_);
  }
  for (const auto& invocation : unanswered) fail(invocation, reason);
  for (const auto& proxy : proxies) proxy->failAll(reason);
}

void FakeRpcListener::setDelegate(std::weak_ptr<QXRpcListenerDelegate> delegate) {
  FakeRecorder recorder;
  {
    const std::lock_guard lock(mutex_);
    delegate_ = std::move(delegate);
    recorder = recorder_;
  }
  if (recorder) recorder("setDelegate");
}

void FakeRpcListener::resume() {
  FakeRecorder recorder;
  std::vector<std::shared_ptr<FakeRpcConnection>> waiting;
  {
    const std::lock_guard lock(mutex_);
    ++resumeCount_;
    recorder = recorder_;
    waiting.swap(waiting_);
  }
  if (recorder) recorder("resume");
  for (const auto& connection : waiting) deliver(connection);
}

void FakeRpcListener::setRecorder(FakeRecorder recorder) {
  const std::lock_guard lock(mutex_);
  recorder_ = std::move(recorder);
}

std::shared_ptr<QXRpcListenerDelegate> FakeRpcListener::delegate() const {
  const std::lock_guard lock(mutex_);
  return delegate_.lock();
}

int FakeRpcListener::resumeCount() const {
  const std::lock_guard lock(mutex_);
  return resumeCount_;
}

void FakeRpcListener::connect(std::shared_ptr<FakeRpcConnection> connection) {
  {
    const std::lock_guard lock(mutex_);
    if (resumeCount_ == 0) {
      waiting_.push_back(std::move(connection));
      return;
    }
  }
  deliver(connection);
}

void FakeRpcListener::deliver(const std::shared_ptr<FakeRpcConnection>& connection) {
  const auto receiver = delegate();
  if (!receiver || !receiver->listener(*this, connection)) connection->close();
}

std::shared_ptr<QXRpcListener> FakeRpcService::listenerForService(const std::string& name) {
  auto listener = std::make_shared<FakeRpcListener>();
  FakeRecorder recorder;
  {
    const std::lock_guard lock(mutex_);
    listeners_[name] = listener;
    createdNames_.push_back(name);
    recorder = recorder_;
  }
  listener->setRecorder(recorder);
  if (recorder) recorder("listenerForService:" + name);
  return listener;
}

void FakeRpcService::setRecorder(FakeRecorder recorder) {
  const std::lock_guard lock(mutex_);
  recorder_ = std::move(recorder);
}

std::shared_ptr<FakeRpcListener> FakeRpcService::listener(const std::string& name) const {
  const std::lock_guard lock(mutex_);
  const auto found = listeners_.find(name);
  return found == listeners_.end() ? nullptr : found->second;
}

std::vector<std::string> FakeRpcService::createdNames() const {
  const std::lock_guard lock(mutex_);
  return createdNames_;
}

}  // namespace docuvend::fake_platform
