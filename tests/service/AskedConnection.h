// A connection that notes which entitlements it is asked for. Its client holds one of them.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/rpc.h"

namespace docuvend {

class AskedConnection final : public QXRpcConnection {
 public:
  explicit AskedConnection(std::string held, QXAuditToken token = {}) : held_(std::move(held)), token_(token) {}

  void setExportedInterface(QXRpcInterface) override {}
  void setExportedObject(std::shared_ptr<QXRpcExportedObject>) override {}
  void resume() override {}
  [[nodiscard]] int processIdentifier() const override { return 1; }
  [[nodiscard]] QXAuditToken auditToken() const override { return token_; }
  [[nodiscard]] std::optional<QXValue> valueForEntitlement(const std::string& name) const override {
    asked.push_back(name);
    return name == held_ ? std::optional<QXValue>(true) : std::nullopt;
  }
  [[nodiscard]] std::shared_ptr<QXRpcProxy> remoteObjectProxy(QXErrorHandler) override { return nullptr; }

  mutable std::vector<std::string> asked;

 private:
  const std::string held_;
  const QXAuditToken token_;
};

}  // namespace docuvend
