// One connection's share of the service "com.orvane.Sandbox".
//
// Answers on the connection's serial context, before the operation returns. A refused token is logged once per connection, with its
// reason but never with its text.
#pragma once

#include <memory>
#include <optional>

#include "platform/linux/sandbox/LinuxSandbox.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/log.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

class SandboxServicer final : public QXSandboxRedemption {
 public:
  // The sandbox and the log outlive it; the connection owns it.
  SandboxServicer(LinuxSandbox& sandbox, QXLogHandle& log, std::weak_ptr<QXRpcConnection> connection)
      : sandbox_(sandbox), log_(log), connection_(std::move(connection)) {}

  void redeemToken(std::optional<QXData> token, std::optional<bool> forWriting, FileReply completionHandler) override;
  void replaceItemWithToken(std::optional<QXData> itemToken, std::optional<QXData> bySiblingWithToken,
                            ErrorReply completionHandler) override;

 private:
  [[nodiscard]] QXAuditToken caller() const;
  void noteRefusal(const QXError& error);

  LinuxSandbox& sandbox_;
  QXLogHandle& log_;
  const std::weak_ptr<QXRpcConnection> connection_;
  bool noted_ = false;  // only on the connection's serial context
};

}  // namespace docuvend::linux_platform
