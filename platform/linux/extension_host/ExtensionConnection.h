// The daemon's side of one request: the connection to the extension's process as the requests see it.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/extension_host.h"
#include "platform/linux/extension_host/ExtensionProcess.h"

namespace docuvend::linux_platform {

// The connection is shared by all requests and running: its exported interface and object are those of the extension host's context
// class, so setting them here changes nothing, and resuming it again neither. The peer is a bundle's process whose entitlements are those
// of the bundle; it has no audit token of its own, because it was not it that connected.
class ExtensionConnection : public QXRpcConnection {
 public:
  // `onFailedMessage` is called for each message of this request that failed, before the sender's own handler.
  ExtensionConnection(std::shared_ptr<ExtensionProcess> process, QXDictionary entitlements, std::function<void()> onFailedMessage)
      : process_(std::move(process)), entitlements_(std::move(entitlements)), onFailedMessage_(std::move(onFailedMessage)) {}

  void setExportedInterface(QXRpcInterface) override {}
  void setExportedObject(std::shared_ptr<QXRpcExportedObject>) override {}
  void resume() override {}
  [[nodiscard]] int processIdentifier() const override { return process_->number(); }
  [[nodiscard]] QXAuditToken auditToken() const override { return {}; }
  [[nodiscard]] std::optional<QXValue> valueForEntitlement(const std::string& name) const override;
  [[nodiscard]] std::shared_ptr<QXRpcProxy> remoteObjectProxy(QXErrorHandler errorHandler) override;

 private:
  std::shared_ptr<ExtensionProcess> process_;
  QXDictionary entitlements_;
  std::function<void()> onFailedMessage_;
};

class ExtensionContext : public QXExtensionContext {
 public:
  explicit ExtensionContext(std::shared_ptr<QXRpcConnection> connection) : connection_(std::move(connection)) {}

  [[nodiscard]] std::shared_ptr<QXRpcConnection> auxiliaryConnection() override { return connection_; }

 private:
  std::shared_ptr<QXRpcConnection> connection_;
};

}  // namespace docuvend::linux_platform
