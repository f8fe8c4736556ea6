// A call is one request over one connection, and a daemon may be restarted at any moment of it. What the caller is told depends on how far
// the request came:
//
//   no daemon is there      wait for one, as long as a restart takes: nothing was asked yet
//   the connection had      ask over another one. A connection that is over is often noticed only by writing to it.
//   ended before
//   it ended afterwards     the request may have run. Repeat it, once, if that is harmless; otherwise say so. Once, because a daemon that
//                           ends of a request must not be ended by it for ever.
//   the service refused     it says why, and would say it again
//   no answer in time       the request stays in the connection's books until its answer comes, which may be never: a connection with many
//                           of those is left behind, and closes when its last running call, or access to a file, is done

#include "sdk/ServiceConnections.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <thread>

#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/Limits.h"
#include "platform/rpc_errors.h"

namespace docuvend::sdk_detail {

using linux_platform::Endpoint;
using linux_platform::MessageFate;
using linux_platform::UniqueDescriptor;

namespace {

constexpr std::chrono::milliseconds kRestartInterval{50};
constexpr int kMaximumRepeats = 1;
// Far below the number of unanswered requests that a connection may have.
constexpr std::size_t kMaximumAbandonedCalls = linux_platform::kMaximumPendingCalls / 4;

// As while a daemon is being started.
bool isAbsence(const QXError& error) {
  if (error.domain != kQXSystemErrorDomain) return false;
  return error.code == ENOENT || error.code == ECONNREFUSED;
}

// The service ended the connection without having run anything.
bool isRefusal(const QXError& error) {
  if (error.domain != kQXRpcErrorDomain) return false;
  const auto code = static_cast<QXRpcErrorCode>(error.code);
  return code == QXRpcErrorCode::refused || code == QXRpcErrorCode::unsupportedVersion;
}

}  // namespace

bool Attempts::waitForDaemon() {
  if (!waitingUntil_) waitingUntil_ = std::min(until_, after(patience_));
  const auto left = *waitingUntil_ - std::chrono::steady_clock::now();
  if (left <= left.zero()) return false;
  std::this_thread::sleep_for(std::min<std::chrono::steady_clock::duration>(left, kRestartInterval));
  return true;
}

bool Attempts::mayRepeat() {
  if (++repeats_ > kMaximumRepeats) return false;
  waitingUntil_.reset();
  endedConnections_ = 0;
  return true;
}

Result<std::string> ServiceConnections::runtimeDirectory() {
  const char* runtime = std::getenv("XDG_RUNTIME_DIR");
  if (runtime == nullptr || runtime[0] != '/') {
    return makeConsumerError(ConsumerErrorCode::unreachable, "XDG_RUNTIME_DIR is not set to an absolute path.");
  }
  return std::string(runtime) + "/docuvend";
}

Failure ServiceConnections::connect(const std::string& service, TimePoint until) {
  Attempts once(until, /*patience=*/std::chrono::milliseconds(0));
  auto reached = reach(service, once);
  if (auto* error = std::get_if<QXError>(&reached)) return std::move(*error);
  return std::nullopt;
}

Result<std::shared_ptr<Connection>> ServiceConnections::reach(const std::string& service, Attempts& attempts) {
  if (auto connection = open(service)) return connection;
  auto socket = connectSocket(service, attempts);
  if (auto* error = std::get_if<QXError>(&socket)) return std::move(*error);
  return keep(service, std::get<UniqueDescriptor>(std::move(socket)));
}

Result<std::shared_ptr<Connection>> ServiceConnections::connectAnew(const std::string& service, TimePoint until) {
  Attempts attempts(until, patience_);
  auto socket = connectSocket(service, attempts);
  if (auto* error = std::get_if<QXError>(&socket)) return std::move(*error);
  return make(service, std::get<UniqueDescriptor>(std::move(socket)));
}

Result<UniqueDescriptor> ServiceConnections::connectSocket(const std::string& service, Attempts& attempts) const {
  if (!reactor_.isRunning()) return QXError::system(EAGAIN, "The system gives no thread to talk to the Docuvend daemon.");
  for (;;) {
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(attempts.until() - std::chrono::steady_clock::now());
    auto socket = linux_platform::connectToSocket(socketDirectory_ + "/" + service, left);
    const auto* error = std::get_if<QXError>(&socket);
    if (error == nullptr || !isAbsence(*error) || !attempts.waitForDaemon()) {
      if (error == nullptr) return std::get<UniqueDescriptor>(std::move(socket));
      return makeConsumerError(ConsumerErrorCode::unreachable, "The Docuvend daemon cannot be reached.", *error);
    }
  }
}

std::shared_ptr<Connection> ServiceConnections::open(const std::string& service) {
  std::shared_ptr<Connection> left;  // goes when nothing is locked any more
  const std::lock_guard lock(mutex_);
  const auto found = open_.find(service);
  if (found == open_.end()) return nullptr;
  if (*found->second->abandonedCalls < kMaximumAbandonedCalls) return found->second;
  left = std::move(found->second);
  open_.erase(found);
  return nullptr;
}

std::shared_ptr<Connection> ServiceConnections::keep(const std::string& service, UniqueDescriptor socket) {
  const std::lock_guard lock(mutex_);
  auto& kept = open_[service];
  if (!kept) kept = make(service, std::move(socket));
  return kept;
}

std::shared_ptr<Connection> ServiceConnections::make(const std::string& service, UniqueDescriptor socket) {
  auto connection = std::make_shared<Connection>();
  Endpoint::Handlers handlers;
  // `this` is safe: the reactor has run its last handler before anything else of this object goes.
  handlers.onClose = [this, service, weak = std::weak_ptr(connection)](const QXError&) {
    const auto ended = weak.lock();
    if (!ended) return;
    ended->hasEnded = true;
    drop(service, *ended);
  };
  connection->endpoint = Endpoint::create(reactor_, std::move(socket), {linux_platform::kProtocolVersion, actAs_}, std::move(handlers));
  connection->endpoint->resume();
  return connection;
}

void ServiceConnections::drop(const std::string& service, const Connection& connection) {
  std::shared_ptr<Connection> dropped;  // goes when nothing is locked any more
  const std::lock_guard lock(mutex_);
  const auto found = open_.find(service);
  if (found == open_.end() || found->second.get() != &connection) return;
  dropped = std::move(found->second);
  open_.erase(found);
}

bool ServiceConnections::mayAskAgain(const std::string& service, const Connection& connection, const NotDelivered& failure, Repeat repeat,
                                     Attempts& attempts) {
  if (failure.fate == MessageFate::refused || isRefusal(failure.error)) return false;
  drop(service, connection);  // its own end may be told later
  if (failure.fate == MessageFate::unsent) return attempts.mayTryAnotherConnection();
  return repeat == Repeat::harmless && attempts.mayRepeat();
}

QXError ServiceConnections::finalError(const NotDelivered& failure) {
  if (failure.fate == MessageFate::refused || isRefusal(failure.error)) return failure.error;
  if (failure.fate == MessageFate::unsent) {
    return makeConsumerError(ConsumerErrorCode::unreachable, "The Docuvend daemon cannot be reached.", failure.error);
  }
  return makeConsumerError(ConsumerErrorCode::connectionLost, "The Docuvend daemon ended before it answered.", failure.error);
}

QXError ServiceConnections::notInTime() { return makeConsumerError(ConsumerErrorCode::deadlinePassed, "No answer came in time."); }

}  // namespace docuvend::sdk_detail
