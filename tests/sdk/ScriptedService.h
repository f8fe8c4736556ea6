// A named service of one process, at the place where consumers look for it, whose operations do what a test says.
#pragma once

#include <gtest/gtest.h>
#include <sys/epoll.h>
#include <sys/socket.h>

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/rpc/BoundSocket.h"
#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/rpc_protocol.h"

namespace docuvend::tests {

template <class Protocol>
class ScriptedService {
 public:
  ScriptedService(const std::string& path, std::shared_ptr<Protocol> object) : object_(std::move(object)) {
    auto bound = linux_platform::BoundSocket::create(path);
    if (auto* socket = std::get_if<std::unique_ptr<linux_platform::BoundSocket>>(&bound)) socket_ = std::move(*socket);
    if (!socket_) {
      ADD_FAILURE() << "no socket for " << path;
      return;
    }
    // `this` is safe: the reactor has run its last handler before anything else of the service goes.
    // So is the reactor's address, not the pointer to it: that is empty already while `stop` waits for the last handler.
    registration_ = reactor_->watch(socket_->descriptor(), EPOLLIN, [this, &reactor = *reactor_](std::uint32_t) -> std::uint32_t {
      accept(reactor);
      return EPOLLIN;
    });
  }
  ~ScriptedService() { stop(); }
  ScriptedService(const ScriptedService&) = delete;
  ScriptedService& operator=(const ScriptedService&) = delete;

  // As when a daemon is killed: every connection ends. No operation runs any more when this returns.
  void stop() {
    registration_.reset();
    {
      const std::lock_guard lock(mutex_);
      endpoints_.clear();
    }
    reactor_.reset();
  }
  // Ends the connections that there are; may be called by an operation.
  void endConnections() {
    std::vector<std::shared_ptr<linux_platform::Endpoint>> ended;
    const std::lock_guard lock(mutex_);
    ended.swap(endpoints_);
  }

  // Ends every further connection with that error.
  void refuse(const QXError& error) {
    const std::lock_guard lock(mutex_);
    refusal_ = error;
  }

  // What the clients so far declared, in the order of their hellos.
  [[nodiscard]] std::vector<std::optional<std::string>> declared() {
    const std::lock_guard lock(mutex_);
    return declared_;
  }

 private:
  void accept(linux_platform::Reactor& reactor) {
    linux_platform::UniqueDescriptor client(::accept4(socket_->descriptor(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!client) return;
    linux_platform::Endpoint::Handlers handlers;
    handlers.onHello = [this](const linux_platform::Hello& hello) -> std::optional<QXError> {
      const std::lock_guard lock(mutex_);
      declared_.push_back(hello.declaredBundle);
      return refusal_;
    };
    auto endpoint = linux_platform::Endpoint::create(reactor, std::move(client), {}, std::move(handlers));
    endpoint->setExportedInterface(qxInterfaceOf<Protocol>());
    endpoint->setExportedObject(std::make_shared<QXRpcExport<Protocol>>(object_));
    {
      const std::lock_guard lock(mutex_);
      endpoints_.push_back(endpoint);
    }
    endpoint->resume();
  }

  const std::shared_ptr<Protocol> object_;
  std::mutex mutex_;  // guards the three below
  std::optional<QXError> refusal_;
  std::vector<std::optional<std::string>> declared_;
  std::vector<std::shared_ptr<linux_platform::Endpoint>> endpoints_;
  std::unique_ptr<linux_platform::BoundSocket> socket_;
  std::unique_ptr<linux_platform::Reactor> reactor_ = std::make_unique<linux_platform::Reactor>(1);
  std::shared_ptr<linux_platform::Reactor::Registration> registration_;
};

// The pointer is taken away when no operation can read it any more.
template <class Protocol>
void stop(std::unique_ptr<ScriptedService<Protocol>>& service) {
  if (service) service->stop();
  service.reset();
}

}  // namespace docuvend::tests
