// One connection's share of the service "com.orvane.FileCoordination".
//
// Runs on the connection's serial context, which it never keeps waiting. When it goes, its accesses end. What an operation says of a
// file it says after the caller was found able to reach it.
#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <utility>
#include <variant>

#include "platform/linux/coordination/AccessSession.h"
#include "platform/linux/coordination/FileAccesses.h"
#include "platform/linux/coordination/LinuxFileCoordinator.h"
#include "platform/linux/identity/PeerIdentity.h"
#include "platform/linux/sandbox/LinuxSandbox.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

class FileCoordinationServicer final : public QXFileCoordination {
 public:
  // An answer names no more holders of a file than this.
  static constexpr std::size_t kMaximumHoldersNamed = 1024;

  // What the servicers of all connections share.
  struct Surroundings {
    LinuxFileCoordinator& coordinator;
    FileAccesses& accesses;
    LinuxSandbox& sandbox;
    PeerDirectory& peers;
  };

  // What is around outlives it; the connection owns it.
  FileCoordinationServicer(const Surroundings& surroundings, std::weak_ptr<QXRpcConnection> connection)
      : surroundings_(surroundings), connection_(std::move(connection)), session_(std::make_shared<AccessSession>(surroundings.accesses)) {}

  void coordinateReadingItemAtURL(std::optional<QXURL> url, std::optional<QXData> token, std::optional<QXUUID> accessID,
                                  std::optional<std::int64_t> party, ErrorReply completionHandler) override;
  void coordinateWritingItemAtURL(std::optional<QXURL> url, std::optional<QXData> token, std::optional<QXUUID> accessID,
                                  std::optional<std::int64_t> party, ErrorReply completionHandler) override;
  void endAccess(std::optional<QXUUID> accessID, ErrorReply completionHandler) override;
  void progressOfAccess(std::optional<QXUUID> accessID, ProgressReply completionHandler) override;
  void holdersOfItemAtURL(std::optional<QXURL> url, std::optional<QXData> token, HoldersReply completionHandler) override;
  void writerDidFinishWritingForURL(std::optional<QXURL> url, ErrorReply completionHandler) override;

 private:
  struct Request {
    std::optional<QXURL> url;
    std::optional<QXData> token;
    std::optional<QXUUID> accessID;
    std::optional<std::int64_t> party;
  };
  void coordinate(AccessKind kind, const Request& request, ErrorReply completionHandler);
  struct Admitted {
    std::shared_ptr<const PeerIdentity> caller;
    KeyedFile file;
  };
  // The caller and the file, if the one can reach the other in that way; else why it is not served. Everything after this goes by the
  // file's own URL: a link on the caller's way to it may lead elsewhere by then.
  [[nodiscard]] std::variant<Admitted, QXError> admit(AccessKind kind, const std::optional<QXURL>& url,
                                                      const std::optional<QXData>& token) const;

  const Surroundings surroundings_;
  const std::weak_ptr<QXRpcConnection> connection_;
  const std::shared_ptr<AccessSession> session_;  // answers that are still due know it, but do not keep it
};

}  // namespace docuvend::linux_platform
