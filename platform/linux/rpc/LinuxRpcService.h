// Named services at Unix sockets.
#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/linux/identity/PeerIdentity.h"
#include "platform/linux/rpc/ActivatedSockets.h"
#include "platform/linux/rpc/ConnectionLimiter.h"
#include "platform/linux/rpc/NamedService.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/log.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

class LinuxRpcListener;

class LinuxRpcService final : public QXRpcService {
 public:
  // A passed socket serves the name that the service manager calls it by or that ends its path; nothing is bound then. The reactor, the
  // directory and the log outlive the service and its listeners.
  LinuxRpcService(Reactor& reactor, PeerDirectory& peers, QXLogHandle& log, NamedServices services,
                  std::vector<ActivatedSocket> passedSockets = {});

  // The caller owns the listener. A name that is none of the services' or whose socket cannot be bound ends the process, with one log line.
  [[nodiscard]] std::shared_ptr<QXRpcListener> listenerForService(const std::string& name) override;

  // Ends the connections of confined peers whose bundle was removed or replaced; to be called when that may have happened.
  void endOutdatedConnections();

  // The connections that are open now, to all services together.
  [[nodiscard]] std::size_t connectionCount() const { return limiter_->openConnections(); }

 private:
  [[nodiscard]] std::shared_ptr<LinuxRpcListener> makeListener(const std::string& name, const NamedService& named);
  [[nodiscard]] UniqueDescriptor takePassedSocket(const std::string& name);
  [[noreturn]] void giveUp(const std::string& name, const QXError& error) const;

  Reactor& reactor_;
  PeerDirectory& peers_;
  QXLogHandle& log_;
  const NamedServices services_;
  const std::shared_ptr<ConnectionLimiter> limiter_ = std::make_shared<ConnectionLimiter>();

  std::mutex mutex_;                                        // guards the rest
  std::vector<ActivatedSocket> passedSockets_;              // not given to a listener yet
  std::vector<std::weak_ptr<LinuxRpcListener>> listeners_;  // all that were made
};

}  // namespace docuvend::linux_platform
