// One connection's share of the service "com.orvane.Sandbox".
//
// A file that is there is redeemed on the connection's serial context, before the operation returns. What may have to wait for the disk, or
// for others who write, is answered later and elsewhere, and the connection's next requests are served meanwhile. A refused token is logged
// once per connection, with its reason but never with its text.
#pragma once

#include <atomic>
#include <memory>
#include <optional>

#include "platform/linux/sandbox/LinuxSandbox.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/log.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

class SandboxServicer final : public QXSandboxRedemption, public std::enable_shared_from_this<SandboxServicer> {
 public:
  // The sandbox and the log outlive it. The connection owns it, with what is being done for it elsewhere.
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
  std::atomic<bool> noted_{false};
};

}  // namespace docuvend::linux_platform
