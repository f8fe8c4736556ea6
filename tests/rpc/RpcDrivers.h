// The two RPC services behind one face: a listener, and clients that connect to it.
#pragma once

#include <stdlib.h>

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <variant>

#include "platform/fake/FakeLog.h"
#include "platform/fake/FakeRpc.h"
#include "platform/linux/rpc/LinuxRpcService.h"
#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/Endpoint.h"
#include "platform/rpc.h"
#include "tests/rpc/TestPeerDirectory.h"

namespace docuvend::tests {

inline constexpr const char* kServiceName = "com.example.Service";
// Of its operations.
inline constexpr const char* kGivesSomethingBack = "echoMany:number:real:data:url:uuid:array:dictionary:error:item:completion:";

class TemporaryDirectory {
 public:
  TemporaryDirectory() : path_((std::filesystem::temp_directory_path() / "rpcXXXXXX").string()) {
    if (::mkdtemp(path_.data()) == nullptr) path_.clear();
  }
  TemporaryDirectory(const TemporaryDirectory&) = delete;
  TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;
  ~TemporaryDirectory() {
    if (!path_.empty()) std::filesystem::remove_all(path_);
  }

  [[nodiscard]] const std::string& path() const { return path_; }

 private:
  std::string path_;
};

class FakeDriver {
 public:
  class Client {
   public:
    explicit Client(std::shared_ptr<fake_platform::FakeRpcConnection> connection) : connection_(std::move(connection)) {}
    [[nodiscard]] std::shared_ptr<QXRpcProxy> proxy(QXErrorHandler errorHandler) const {
      return connection_->peer(std::move(errorHandler));
    }
    void leave() { connection_->close(); }

   private:
    std::shared_ptr<fake_platform::FakeRpcConnection> connection_;
  };

  [[nodiscard]] std::shared_ptr<QXRpcListener> listener() { return service_.listenerForService(kServiceName); }
  void setNextPeer(QXDictionary entitlements) { entitlements_ = std::move(entitlements); }
  [[nodiscard]] Client connect() {
    auto connection = fake_platform::FakeRpcConnection::create();
    connection->setProcessIdentifier(::getpid());
    connection->setAuditToken(TestPeerDirectory::tokenOf(++connections_));
    for (const auto& [name, value] : entitlements_) connection->setEntitlement(name, value);
    service_.listener(kServiceName)->connect(connection);
    return Client(connection);
  }

 private:
  fake_platform::FakeRpcService service_;
  QXDictionary entitlements_;
  std::uint8_t connections_ = 0;
};

class LinuxDriver {
 public:
  class Client {
   public:
    Client(std::shared_ptr<linux_platform::Endpoint> endpoint) : endpoint_(std::move(endpoint)) {}
    [[nodiscard]] std::shared_ptr<QXRpcProxy> proxy(QXErrorHandler errorHandler) const {
      return endpoint_->remoteObjectProxy(std::move(errorHandler));
    }
    void leave() { endpoint_->close(QXError::system(ECONNABORTED, "leaving")); }

   private:
    std::shared_ptr<linux_platform::Endpoint> endpoint_;
  };

  [[nodiscard]] std::shared_ptr<QXRpcListener> listener() { return service.listenerForService(kServiceName); }
  void setNextPeer(QXDictionary entitlements) {
    peers.setNextPeer(linux_platform::Standing::confined, "com.example.App", std::move(entitlements));
  }
  [[nodiscard]] Client connect(linux_platform::Hello hello = {}, std::function<void(const QXError&)> onClose = {}) {
    auto socket = linux_platform::connectToSocket(socketPath);
    linux_platform::Endpoint::Handlers handlers;
    handlers.onClose = std::move(onClose);
    auto endpoint = linux_platform::Endpoint::create(reactor, std::get<linux_platform::UniqueDescriptor>(std::move(socket)),
                                                     std::move(hello), std::move(handlers));
    endpoint->resume();
    return Client(std::move(endpoint));
  }

  TemporaryDirectory directory;
  const std::string socketPath = directory.path() + "/" + kServiceName;
  fake_platform::FakeLog log;
  TestPeerDirectory peers;
  linux_platform::Reactor reactor{3};
  linux_platform::LinuxRpcService service{
      reactor,
      peers,
      log.defaultLog(),
      {{kServiceName, {socketPath, linux_platform::Audience::everyone, std::nullopt, {"ping:", "list:"}, {kGivesSomethingBack}}}}};
};

}  // namespace docuvend::tests
