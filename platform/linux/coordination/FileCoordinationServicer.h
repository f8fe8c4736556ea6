// One connection's share of the service "com.orvane.FileCoordination". Runs on the connection's serial context.
#pragma once

#include <memory>
#include <optional>

#include "platform/linux/coordination/LinuxFileCoordinator.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/rpc.h"
#include "platform/sandbox.h"

namespace docuvend::linux_platform {

class FileCoordinationServicer final : public QXFileCoordination {
 public:
  // The coordinator and the sandbox outlive it; the connection owns it.
  FileCoordinationServicer(LinuxFileCoordinator& coordinator, QXSandbox& sandbox, std::weak_ptr<QXRpcConnection> connection)
      : coordinator_(coordinator), sandbox_(sandbox), connection_(std::move(connection)) {}

  void coordinateReadingItemAtURL(std::optional<QXURL>, std::optional<QXData>, std::optional<QXUUID>, std::optional<std::int64_t>,
                                  ErrorReply) override {}
  void coordinateWritingItemAtURL(std::optional<QXURL>, std::optional<QXData>, std::optional<QXUUID>, std::optional<std::int64_t>,
                                  ErrorReply) override {}
  void endAccess(std::optional<QXUUID>, ErrorReply) override {}
  void progressOfAccess(std::optional<QXUUID>, ProgressReply) override {}
  void holdersOfItemAtURL(std::optional<QXURL>, std::optional<QXData>, HoldersReply) override {}
  void writerDidFinishWritingForURL(std::optional<QXURL> url, ErrorReply completionHandler) override;

 private:
  LinuxFileCoordinator& coordinator_;
  QXSandbox& sandbox_;
  const std::weak_ptr<QXRpcConnection> connection_;
};

}  // namespace docuvend::linux_platform
