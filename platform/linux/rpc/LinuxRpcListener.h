// Accepts the clients of one named service.
//
// The socket listens from creation on, so clients connect and wait; they are accepted from `resume` on, on threads of the reactor, one
// after another. A peer that the service is not for is refused before the delegate hears of it. The listener keeps its connections alive
// until they end; when it goes they are closed.
#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/identity/PeerIdentity.h"
#include "platform/linux/rpc/BoundSocket.h"
#include "platform/linux/rpc/ConnectionLimiter.h"
#include "platform/linux/rpc/LinuxRpcConnection.h"
#include "platform/linux/rpc/NamedService.h"
#include "platform/linux/rpc/RefusalLines.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/log.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

class LinuxRpcListener final : public QXRpcListener, public std::enable_shared_from_this<LinuxRpcListener> {
 public:
  // What listeners share. All of it outlives the listener, the reactor too.
  struct Surroundings {
    Reactor& reactor;
    PeerDirectory& peers;
    QXLogHandle& log;
    std::shared_ptr<ConnectionLimiter> limiter;
  };

  struct Service {
    std::string name;
    Audience audience;
    std::optional<std::string> straightBelow;
    std::vector<std::string> operationsForNobody;
    std::vector<std::string> releasing;
  };

  // A socket of our own, or one that was passed to us; both listen already.
  LinuxRpcListener(Surroundings surroundings, Service service, std::unique_ptr<BoundSocket> socket);
  LinuxRpcListener(Surroundings surroundings, Service service, UniqueDescriptor passedSocket);
  ~LinuxRpcListener() override;

  void setDelegate(std::weak_ptr<QXRpcListenerDelegate> delegate) override;
  void resume() override;

  // Ends the connections of peers that are not what they were any more (PeerDirectory).
  void endOutdated();

 private:
  struct Accepted {
    std::shared_ptr<LinuxRpcConnection> connection;
    std::shared_ptr<const PeerIdentity> peer;  // as it connected
    std::unique_ptr<ConnectionLimiter::Place> place;
  };

  void acceptWaiting();
  [[nodiscard]] bool acceptOne();
  void acceptAndDrop(int errnoValue);
  void tellOfStarvation(const QXError& error);
  void admit(UniqueDescriptor socket);
  [[nodiscard]] bool isFor(const PeerIdentity& peer) const;
  [[nodiscard]] CallRules rulesFor(const PeerIdentity& peer, ConnectionLimiter::Admission& admission) const;
  void refuseOutsider(const PeerIdentity& peer, UniqueDescriptor socket);
  void refuse(UniqueDescriptor socket, const QXError& reason) const;
  void end(LinuxRpcConnection& connection, const PeerIdentity& peer) const;
  void offer(const std::shared_ptr<LinuxRpcConnection>& connection);
  void forget(std::uint64_t number);

  // Constant after construction.
  const Surroundings surroundings_;
  const Service service_;
  const std::unique_ptr<BoundSocket> ownSocket_;
  const UniqueDescriptor passedSocket_;
  const int socket_;

  // Only in the listening socket's handler.
  UniqueDescriptor spare_;
  bool isStarved_ = false;  // logged once until a client is recognised again
  RefusalLines outsiders_;
  std::uint64_t nextNumber_ = 0;

  std::mutex mutex_;  // guards the rest
  std::weak_ptr<QXRpcListenerDelegate> delegate_;
  std::map<std::uint64_t, Accepted> accepted_;
  std::shared_ptr<Reactor::Registration> registration_;
};

}  // namespace docuvend::linux_platform
