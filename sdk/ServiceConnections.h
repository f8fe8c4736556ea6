// One program's connections to the daemon's services: each is made when it is first needed and again after it has ended.
//
// Shared by the libraries' classes; may be used from any thread. Must not go while a call runs.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <type_traits>
#include <utility>
#include <variant>

#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/Reactor.h"
#include "sdk/BlockingCall.h"
#include "sdk/Result.h"

namespace docuvend::sdk_detail {

// Whether a request may be made again when the daemon left between request and answer.
enum class Repeat { harmless, never };

struct Connection {
  std::shared_ptr<linux_platform::Endpoint> endpoint;
  // Calls that nobody waits for any more and whose answers may still come.
  std::shared_ptr<std::atomic<std::size_t>> abandonedCalls = std::make_shared<std::atomic<std::size_t>>(0);
  // Nothing can be asked over it any more. Set soon after the end.
  std::atomic<bool> hasEnded = false;
};

// A call in its connection's count: abandoned from `abandon` until the object goes, which is held by who waits and until the answer comes.
class CountedCall {
 public:
  CountedCall(std::shared_ptr<std::atomic<std::size_t>> abandonedCalls, std::shared_ptr<const void> held)
      : abandonedCalls_(std::move(abandonedCalls)), held_(std::move(held)) {}
  ~CountedCall() {
    if (isAbandoned_) --*abandonedCalls_;
  }
  CountedCall(const CountedCall&) = delete;
  CountedCall& operator=(const CountedCall&) = delete;

  // At most once.
  void abandon() {
    isAbandoned_ = true;
    ++*abandonedCalls_;
  }

 private:
  const std::shared_ptr<std::atomic<std::size_t>> abandonedCalls_;
  const std::shared_ptr<const void> held_;
  bool isAbandoned_ = false;
};

// One call's tries.
class Attempts {
 public:
  Attempts(TimePoint until, std::chrono::milliseconds patience) : until_(until), patience_(patience) {}

  // Waits a little for a daemon that is not there. False: it has been waited for long enough.
  [[nodiscard]] bool waitForDaemon();
  // A connection was there but had ended: false when that has gone on for long enough.
  [[nodiscard]] bool mayTryAnotherConnection() { return ++endedConnections_ == 1 || waitForDaemon(); }
  // The daemon left with the request in hand.
  [[nodiscard]] bool mayRepeat();

  [[nodiscard]] TimePoint until() const { return until_; }

 private:
  const TimePoint until_;
  const std::chrono::milliseconds patience_;
  std::optional<TimePoint> waitingUntil_;  // none: the daemon has not been missed since the last request
  int endedConnections_ = 0;
  int repeats_ = 0;
};

class ServiceConnections {
 public:
  // `actAs`: the bundle that is declared to every service. `patience`: how long a call waits for a daemon that is not there.
  ServiceConnections(std::string socketDirectory, std::optional<std::string> actAs, std::chrono::milliseconds patience)
      : socketDirectory_(std::move(socketDirectory)), actAs_(std::move(actAs)), patience_(patience) {}
  ServiceConnections(const ServiceConnections&) = delete;
  ServiceConnections& operator=(const ServiceConnections&) = delete;

  // The daemon's run-time directory, of the environment.
  [[nodiscard]] static Result<std::string> runtimeDirectory();

  // Connects to the service unless it is connected already. Does not wait for a daemon that is not there.
  [[nodiscard]] Failure connect(const std::string& service, TimePoint until);

  // Asks the service: the values of the operation's reply. Goes to another connection when the one at hand has ended before the request
  // had left, and once more, if that is harmless, when it ended afterwards.
  template <auto Method, class... Arguments>
  [[nodiscard]] Result<ReplyValues<Method>> ask(const char* service, const Waiting& waiting, Repeat repeat, const Arguments&... arguments) {
    return askBy(service, waiting.until, repeat, [&waiting, &arguments...](const std::shared_ptr<Connection>& connection) {
      return callOver<Method>(*connection, waiting, arguments...);
    });
  }
  // The same for those whom it concerns which connection it is: `call` makes the call over the one that it is given, and returns its
  // outcome.
  template <class Call>
  [[nodiscard]] auto askBy(const char* service, TimePoint until, Repeat repeat, const Call& call)
      -> Result<std::variant_alternative_t<0, std::invoke_result_t<const Call&, const std::shared_ptr<Connection>&>>> {
    Attempts attempts(until, patience_);
    for (;;) {
      auto reached = reach(service, attempts);
      if (auto* error = std::get_if<QXError>(&reached)) return std::move(*error);
      const auto& connection = std::get<std::shared_ptr<Connection>>(reached);
      auto outcome = call(connection);
      if (auto* values = std::get_if<0>(&outcome)) return std::move(*values);
      const auto* failure = std::get_if<NotDelivered>(&outcome);
      if (failure == nullptr) return notInTime();
      if (!mayAskAgain(service, *connection, *failure, repeat, attempts)) return finalError(*failure);
    }
  }

  // A connection of the caller's own, for requests that belong together; it waits for a daemon that is not there.
  [[nodiscard]] Result<std::shared_ptr<Connection>> connectAnew(const std::string& service, TimePoint until);
  // Asks over that connection and no other.
  template <auto Method, class... Arguments>
  [[nodiscard]] static Result<ReplyValues<Method>> askOver(const Connection& connection, const Waiting& waiting,
                                                           const Arguments&... arguments) {
    auto outcome = callOver<Method>(connection, waiting, arguments...);
    if (auto* values = std::get_if<ReplyValues<Method>>(&outcome)) return std::move(*values);
    if (const auto* failure = std::get_if<NotDelivered>(&outcome)) return finalError(*failure);
    return notInTime();
  }
  // One try over that connection.
  template <auto Method, class... Arguments>
  [[nodiscard]] static Outcome<Method> callOver(const Connection& connection, const Waiting& waiting, const Arguments&... arguments) {
    Waiting counted = waiting;
    const auto call = std::make_shared<CountedCall>(connection.abandonedCalls, waiting.held);
    counted.held = call;
    auto outcome = callAndWait<Method>(*connection.endpoint, counted, arguments...);
    if (std::holds_alternative<NotInTime>(outcome)) call->abandon();
    return outcome;
  }

 private:
  [[nodiscard]] Result<std::shared_ptr<Connection>> reach(const std::string& service, Attempts& attempts);
  [[nodiscard]] Result<linux_platform::UniqueDescriptor> connectSocket(const std::string& service, Attempts& attempts) const;
  // The one that is open; none when it must be made, also because too many calls over it are abandoned.
  [[nodiscard]] std::shared_ptr<Connection> open(const std::string& service);
  // A connection over that socket, or the one that another thread has made meanwhile.
  [[nodiscard]] std::shared_ptr<Connection> keep(const std::string& service, linux_platform::UniqueDescriptor socket);
  [[nodiscard]] std::shared_ptr<Connection> make(const std::string& service, linux_platform::UniqueDescriptor socket);
  // Later calls need another one; those that run over it go on.
  void drop(const std::string& service, const Connection& connection);

  [[nodiscard]] bool mayAskAgain(const std::string& service, const Connection& connection, const NotDelivered& failure, Repeat repeat,
                                 Attempts& attempts);
  [[nodiscard]] static QXError finalError(const NotDelivered& failure);
  [[nodiscard]] static QXError notInTime();

  const std::string socketDirectory_;
  const std::optional<std::string> actAs_;
  const std::chrono::milliseconds patience_;

  std::mutex mutex_;
  // Guarded by `mutex_`: the connections that are open now, by service.
  std::map<std::string, std::shared_ptr<Connection>> open_;

  // Last, so that its threads have ended before anything that their handlers touch goes.
  linux_platform::Reactor reactor_{1};
};

}  // namespace docuvend::sdk_detail
