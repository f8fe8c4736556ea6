#include "platform/linux/rpc/LinuxRpcService.h"

#include <fcntl.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <utility>
#include <variant>

#include "platform/QXLogMessage.h"
#include "platform/linux/rpc/BoundSocket.h"
#include "platform/linux/rpc/LinuxRpcListener.h"

namespace docuvend::linux_platform {

LinuxRpcService::LinuxRpcService(Reactor& reactor, PeerDirectory& peers, QXLogHandle& log, NamedServices services,
                                 std::vector<ActivatedSocket> passedSockets)
    : reactor_(reactor), peers_(peers), log_(log), services_(std::move(services)), passedSockets_(std::move(passedSockets)) {}

UniqueDescriptor LinuxRpcService::takePassedSocket(const std::string& name) {
  const std::lock_guard lock(mutex_);
  const auto found = std::find_if(passedSockets_.begin(), passedSockets_.end(), [&name](const ActivatedSocket& socket) {
    return socket.name == name || socket.path.substr(socket.path.rfind('/') + 1) == name;
  });
  if (found == passedSockets_.end()) return {};
  UniqueDescriptor descriptor = std::move(found->descriptor);
  passedSockets_.erase(found);
  return descriptor;
}

void LinuxRpcService::giveUp(const std::string& name, const QXError& error) const {
  qxLog(log_, "[ERROR] Cannot publish the service %@: %@", name, error);
  std::_Exit(EXIT_FAILURE);  // other threads are at work: nothing is taken down under them
}

std::shared_ptr<QXRpcListener> LinuxRpcService::listenerForService(const std::string& name) {
  const auto found = services_.find(name);
  if (found == services_.end()) giveUp(name, QXError::system(ENOENT, "no socket is known for it"));
  auto listener = makeListener(name, found->second);
  const std::lock_guard lock(mutex_);
  listeners_.push_back(listener);
  return listener;
}

void LinuxRpcService::endOutdatedConnections() {
  std::vector<std::weak_ptr<LinuxRpcListener>> listeners;
  {
    const std::lock_guard lock(mutex_);
    listeners = listeners_;
  }
  for (const auto& weakListener : listeners) {
    if (const auto strongListener = weakListener.lock()) strongListener->endOutdated();
  }
}

std::shared_ptr<LinuxRpcListener> LinuxRpcService::makeListener(const std::string& name, const NamedService& named) {
  const auto& [socketPath, audience, straightBelow, operationsForNobody, releasing] = named;
  LinuxRpcListener::Surroundings surroundings{reactor_, peers_, log_, limiter_};
  LinuxRpcListener::Service service{name, audience, straightBelow, operationsForNobody, releasing};
  if (auto passed = takePassedSocket(name)) {
    const int flags = ::fcntl(passed.get(), F_GETFL);
    if (flags < 0 || ::fcntl(passed.get(), F_SETFL, flags | O_NONBLOCK) != 0) giveUp(name, QXError::system(errno, "the passed socket"));
    return std::make_shared<LinuxRpcListener>(std::move(surroundings), std::move(service), std::move(passed));
  }
  auto bound = BoundSocket::create(socketPath);
  if (const auto* error = std::get_if<QXError>(&bound)) giveUp(name, *error);
  return std::make_shared<LinuxRpcListener>(std::move(surroundings), std::move(service),
                                            std::get<std::unique_ptr<BoundSocket>>(std::move(bound)));
}

}  // namespace docuvend::linux_platform
