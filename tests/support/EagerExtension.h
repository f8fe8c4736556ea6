// An extension for tests with real threads: whatever it is asked, it answers with success, from another thread.
#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "platform/QXPlatform.h"
#include "platform/extension_host.h"

namespace docuvend::tests {

// What certain messages are answered with, by their full keyword names; every other one is answered with nothing but success.
using EagerAnswers = std::map<std::string, QXArray>;

class EagerProxy final : public QXRpcProxy {
 public:
  explicit EagerProxy(std::shared_ptr<const EagerAnswers> answers) : answers_(std::move(answers)) {}

  void send(const QXRpcOperation& operation, QXArray, QXRpcReply reply) override {
    const auto found = answers_->find(operation.name);
    QXPlatform::current().queues.globalQueue().async([reply = std::move(reply), values = found == answers_->end()
                                                                                             ? QXArray(operation.replies.size())
                                                                                             : found->second] { reply(values); });
  }

 private:
  const std::shared_ptr<const EagerAnswers> answers_;
};

class EagerConnection final : public QXRpcConnection {
 public:
  explicit EagerConnection(std::shared_ptr<const EagerAnswers> answers) : answers_(std::move(answers)) {}

  void setExportedInterface(QXRpcInterface) override {}
  void setExportedObject(std::shared_ptr<QXRpcExportedObject>) override {}
  void resume() override {}
  [[nodiscard]] int processIdentifier() const override { return 0; }
  [[nodiscard]] QXAuditToken auditToken() const override { return {}; }
  [[nodiscard]] std::optional<QXValue> valueForEntitlement(const std::string&) const override { return std::nullopt; }
  [[nodiscard]] std::shared_ptr<QXRpcProxy> remoteObjectProxy(QXErrorHandler) override { return std::make_shared<EagerProxy>(answers_); }

 private:
  const std::shared_ptr<const EagerAnswers> answers_;
};

class EagerContext final : public QXExtensionContext {
 public:
  explicit EagerContext(std::shared_ptr<const EagerAnswers> answers) : answers_(std::move(answers)) {}

  [[nodiscard]] std::shared_ptr<QXRpcConnection> auxiliaryConnection() override { return std::make_shared<EagerConnection>(answers_); }

 private:
  const std::shared_ptr<const EagerAnswers> answers_;
};

// Counts the requests that were ended. May be used from any thread.
class EagerExtension final : public QXExtension {
 public:
  EagerExtension(std::string identifier, int version, EagerAnswers answers = {})
      : identifier_(std::move(identifier)), version_(version), answers_(std::make_shared<const EagerAnswers>(std::move(answers))) {}

  [[nodiscard]] std::optional<std::string> identifier() const override { return identifier_; }
  [[nodiscard]] std::string description() const override { return identifier_; }
  [[nodiscard]] bool isEqual(const QXExtension& other) const override {
    const auto& eager = dynamic_cast<const EagerExtension&>(other);
    return eager.identifier_ == identifier_ && eager.version_ == version_;
  }
  void beginExtensionRequest(BeginCompletion completion) override {
    QXPlatform::current().queues.globalQueue().async(
        [completion = std::move(completion)] { completion(QXUUID{}, /*error=*/std::nullopt); });
  }
  void cancelExtensionRequest(const QXUUID&) override { ++cancelled; }
  [[nodiscard]] std::shared_ptr<QXExtensionContext> extensionContextForRequest(const QXUUID&) override {
    return std::make_shared<EagerContext>(answers_);
  }

  std::atomic<int> cancelled = 0;

 private:
  const std::string identifier_;
  const int version_;
  const std::shared_ptr<const EagerAnswers> answers_;
};

}  // namespace docuvend::tests
