#include "platform/fake/FakeExtensionHost.h"

#include <cassert>
#include <utility>

namespace docuvend::fake_platform {
namespace {

class VendorProxy : public QXRpcProxy {
 public:
  VendorProxy(std::shared_ptr<FakeVendor> vendor, QXErrorHandler errorHandler)
      : vendor_(std::move(vendor)), errorHandler_(std::move(errorHandler)) {}

  void send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) override {
    vendor_->send(errorHandler_, operation, std::move(arguments), std::move(reply));
  }

 private:
  std::shared_ptr<FakeVendor> vendor_;
  QXErrorHandler errorHandler_;
};

class VendorConnection : public QXRpcConnection {
 public:
  explicit VendorConnection(std::shared_ptr<FakeVendor> vendor) : vendor_(std::move(vendor)) {}

  void setExportedInterface(QXRpcInterface) override {}
  void setExportedObject(std::shared_ptr<QXRpcExportedObject>) override {}
  void resume() override {}
  [[nodiscard]] int processIdentifier() const override { return 0; }
  [[nodiscard]] QXAuditToken auditToken() const override { return {}; }
  [[nodiscard]] std::optional<QXValue> valueForEntitlement(const std::string&) const override { return std::nullopt; }
  [[nodiscard]] std::shared_ptr<QXRpcProxy> remoteObjectProxy(QXErrorHandler errorHandler) override {
    vendor_->addProxy(errorHandler);
    return std::make_shared<VendorProxy>(vendor_, std::move(errorHandler));
  }

 private:
  std::shared_ptr<FakeVendor> vendor_;
};

class Context : public QXExtensionContext {
 public:
  explicit Context(std::shared_ptr<QXRpcConnection> connection) : connection_(std::move(connection)) {}

  [[nodiscard]] std::shared_ptr<QXRpcConnection> auxiliaryConnection() override { return connection_; }

 private:
  std::shared_ptr<QXRpcConnection> connection_;
};

}  // namespace

std::vector<std::string> FakeVendor::operationNames() const {
  std::vector<std::string> names;
  names.reserve(messages_.size());
  for (const Message& message : messages_) names.push_back(message.operation.name);
  return names;
}

void FakeVendor::respond(std::string operationName, Responder responder) {
  responders_.insert_or_assign(std::move(operationName), std::move(responder));
}

void FakeVendor::answer(std::size_t message, QXArray values) {
  assert(message < messages_.size());
  // Copies: the reply may send the next message.
  const QXRpcReply reply = messages_[message].reply;
  assert(!qxMismatch(messages_[message].operation.replies, values));
  if (reply) reply(std::move(values));
}

void FakeVendor::failDelivery(std::size_t message, const QXError& error) {
  assert(message < messages_.size());
  const QXErrorHandler handler = messages_[message].errorHandler;
  if (handler) handler(error);
}

void FakeVendor::forget() {
  // What is let go may call back into here while it is destroyed.
  const auto messages = std::exchange(messages_, {});
  const auto proxies = std::exchange(proxies_, {});
  const auto responders = std::exchange(responders_, {});
}

std::shared_ptr<QXRpcConnection> FakeVendor::connection() { return std::make_shared<VendorConnection>(shared_from_this()); }

void FakeVendor::send(QXErrorHandler errorHandler, const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) {
  assert(!qxMismatch(operation.arguments, arguments));
  messages_.push_back({operation, std::move(arguments), std::move(reply), std::move(errorHandler)});
  const std::size_t index = messages_.size() - 1;
  const auto found = responders_.find(operation.name);
  if (found == responders_.end()) return;
  const Responder responder = found->second;
  if (std::optional<QXArray> values = responder(messages_[index].arguments)) answer(index, std::move(*values));
}

std::string FakeExtension::description() const {
  return "<FakeExtension " + identifier_.value_or("(null)") + " " + std::to_string(version_) + ">";
}

bool FakeExtension::isEqual(const QXExtension& other) const {
  const auto* fake = dynamic_cast<const FakeExtension*>(&other);
  return fake != nullptr && fake->identifier_ == identifier_ && fake->version_ == version_;
}

void FakeExtension::beginExtensionRequest(BeginCompletion completion) {
  ++beginCount_;
  switch (begin_) {
    case Begin::fresh:
      give(completion, uuid(static_cast<std::uint8_t>(beginCount_)));
      break;
    case Begin::chosen:
      give(completion, chosen_);
      break;
    case Begin::error: {
      const QXError error = error_;
      completion(/*request=*/std::nullopt, error);
      break;
    }
    case Begin::hold:
      held_.push_back(std::move(completion));
      break;
  }
}

void FakeExtension::cancelExtensionRequest(const QXUUID& request) {
  cancelled_.push_back(request);
  open_.erase(request);
}

std::shared_ptr<QXExtensionContext> FakeExtension::extensionContextForRequest(const QXUUID& request) {
  if (!hasContexts_ || !open_.contains(request)) return nullptr;
  return std::make_shared<Context>(vendor_->connection());
}

void FakeExtension::answerBegins() { begin_ = Begin::fresh; }

void FakeExtension::answerBeginsWith(const QXUUID& request) {
  begin_ = Begin::chosen;
  chosen_ = request;
}

void FakeExtension::failBegins(QXError error) {
  begin_ = Begin::error;
  error_ = std::move(error);
}

void FakeExtension::holdBegins() { begin_ = Begin::hold; }

void FakeExtension::answerHeldBegin(const QXUUID& request) {
  assert(!held_.empty());
  const BeginCompletion completion = std::move(held_.front());
  held_.erase(held_.begin());
  give(completion, request);
}

void FakeExtension::failHeldBegin(QXError error) {
  assert(!held_.empty());
  const BeginCompletion completion = std::move(held_.front());
  held_.erase(held_.begin());
  completion(/*request=*/std::nullopt, std::move(error));
}

QXUUID FakeExtension::uuid(std::uint8_t number) {
  QXUUID result;
  result.bytes.back() = number;
  return result;
}

void FakeExtension::give(const BeginCompletion& completion, const QXUUID& request) {
  requests_.push_back(request);
  open_.insert(request);
  completion(request, /*error=*/std::nullopt);
}

class FakeExtensionHost::Match : public QXExtensionMatch {
 public:
  explicit Match(std::shared_ptr<MatchHandler> handler) : handler_(std::move(handler)) {}

 private:
  std::shared_ptr<MatchHandler> handler_;
};

std::unique_ptr<QXExtensionMatch> FakeExtensionHost::beginMatching(Attributes attributes, QXExtensionContextClass contextClass,
                                                                   MatchHandler handler) {
  begun_.push_back({std::move(attributes), &contextClass.hostInterface, &contextClass.vendorInterface});
  auto shared = std::make_shared<MatchHandler>(std::move(handler));
  handlers_.push_back(shared);
  auto match = std::make_unique<Match>(std::move(shared));
  if (onBeginMatching_) onBeginMatching_();
  return match;
}

void FakeExtensionHost::setExtensions(Extensions extensions) {
  extensions_ = std::move(extensions);
  deliver();
}

void FakeExtensionHost::deliver() {
  const auto handlers = handlers_;
  for (const auto& weak : handlers) {
    if (const auto handler = weak.lock()) (*handler)(extensions_, /*error=*/std::nullopt);
  }
}

void FakeExtensionHost::deliverError(const QXError& error) {
  const auto handlers = handlers_;
  for (const auto& weak : handlers) {
    if (const auto handler = weak.lock()) (*handler)(/*extensions=*/{}, error);
  }
}

std::size_t FakeExtensionHost::liveMatchCount() const {
  std::size_t count = 0;
  for (const auto& weak : handlers_) count += weak.expired() ? 0 : 1;
  return count;
}

}  // namespace docuvend::fake_platform
