// One program's connections to the daemon's services: each is made when it is first needed and again after it has ended.
//
// Shared by the libraries' classes; may be used from any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <variant>

#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/Reactor.h"
#include "sdk/BlockingCall.h"
#include "sdk/Result.h"

namespace docuvend::sdk_detail {

class ServiceConnections {
 public:
  // `actAs`: the bundle that is declared to every service.
  ServiceConnections(std::string socketDirectory, std::optional<std::string> actAs)
      : socketDirectory_(std::move(socketDirectory)), actAs_(std::move(actAs)) {}
  ServiceConnections(const ServiceConnections&) = delete;
  ServiceConnections& operator=(const ServiceConnections&) = delete;

  // The daemon's run-time directory, of the environment.
  [[nodiscard]] static Result<std::string> runtimeDirectory();

  [[nodiscard]] const std::optional<std::string>& actAs() const { return actAs_; }

  // Connects to the service unless it is connected already.
  [[nodiscard]] Failure reach(const std::string& service);

  // The values of the operation's reply.
  template <class Protocol, auto Method, class... Arguments>
  [[nodiscard]] Result<ReplyValues<Method>> ask(const char* service, std::chrono::milliseconds deadline, Arguments&&... arguments) {
    auto reached = endpoint(service);
    if (auto* error = std::get_if<QXError>(&reached)) return *error;
    return callAndWait<Protocol, Method>(*std::get<std::shared_ptr<linux_platform::Endpoint>>(reached), deadline,
                                         std::forward<Arguments>(arguments)...);
  }

 private:
  struct Open {
    std::uint64_t serial;
    std::shared_ptr<linux_platform::Endpoint> endpoint;
  };
  [[nodiscard]] Result<std::shared_ptr<linux_platform::Endpoint>> endpoint(const std::string& service);
  void drop(const std::string& service, std::uint64_t serial);

  const std::string socketDirectory_;
  const std::optional<std::string> actAs_;

  std::mutex mutex_;
  // Guarded by `mutex_`: the connections that are open now, by service.
  std::map<std::string, Open> open_;
  std::uint64_t lastSerial_ = 0;

  // Last, so that its threads have ended before anything that their handlers touch goes.
  linux_platform::Reactor reactor_{1};
};

}  // namespace docuvend::sdk_detail
