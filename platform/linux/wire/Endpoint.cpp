#include "platform/linux/wire/Endpoint.h"

#include <cerrno>
#include <utility>

#include "platform/linux/wire/EndpointState.h"

namespace docuvend::linux_platform {

class Endpoint::Proxy final : public QXRpcProxy {
 public:
  Proxy(std::shared_ptr<Endpoint> endpoint, FailureHandler failureHandler)
      : endpoint_(std::move(endpoint)), failureHandler_(std::make_shared<const FailureHandler>(std::move(failureHandler))) {}

  void send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) override {
    const bool isForSomebody = LogSubject::current() != nullptr;
    endpoint_->state_->send(
        operation, std::move(arguments), LogSubject::carrying(std::move(reply)),
        isForSomebody ? std::make_shared<const FailureHandler>(LogSubject::carrying(*failureHandler_)) : failureHandler_);
  }

 private:
  const std::shared_ptr<Endpoint> endpoint_;
  const std::shared_ptr<const FailureHandler> failureHandler_;
};

Endpoint::Endpoint(std::shared_ptr<State> state) : state_(std::move(state)) {}

Endpoint::~Endpoint() { state_->close(QXError::system(ECONNABORTED, "the connection was released"), State::Farewell::silent); }

std::shared_ptr<Endpoint> Endpoint::create(Reactor& reactor, UniqueDescriptor socket, Hello hello, Handlers handlers, CallRules rules) {
  auto state = std::make_shared<State>(reactor, std::move(socket), std::move(handlers), std::move(rules));
  auto endpoint = std::shared_ptr<Endpoint>(new Endpoint(state));
  state->sendHello(std::move(hello));
  return endpoint;
}

void Endpoint::setExportedInterface(QXRpcInterface interface) { state_->incoming.setInterface(std::move(interface)); }

void Endpoint::setExportedObject(std::shared_ptr<QXRpcExportedObject> object) { state_->incoming.setObject(std::move(object)); }

void Endpoint::resume() { state_->resume(); }

std::shared_ptr<QXRpcProxy> Endpoint::remoteObjectProxy(QXErrorHandler errorHandler) {
  FailureHandler failureHandler;
  if (errorHandler) failureHandler = [errorHandler = std::move(errorHandler)](const QXError& error, MessageFate) { errorHandler(error); };
  return remoteObjectProxy(std::move(failureHandler));
}

std::shared_ptr<QXRpcProxy> Endpoint::remoteObjectProxy(FailureHandler failureHandler) {
  return std::make_shared<Proxy>(shared_from_this(), std::move(failureHandler));
}

void Endpoint::ping(std::function<void()> onPong) { state_->ping(std::move(onPong)); }

bool Endpoint::awaitsAnswers() const { return state_->awaitsAnswers(); }

void Endpoint::close(const QXError& reason) { state_->close(reason, State::Farewell::tellPeer); }

void Endpoint::closeOnReadingThread(const QXError& reason) {
  state_->close(reason, State::Farewell::tellPeer, State::Cause::ordinary, State::Thread::reading);
}

}  // namespace docuvend::linux_platform
