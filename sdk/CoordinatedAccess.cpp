#include "sdk/CoordinatedAccess.h"

#include <thread>
#include <utility>

#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/rpc_errors.h"
#include "sdk/ConsumerErrors.h"
#include "sdk/ServiceConnections.h"

namespace docuvend {

using linux_platform::QXFileCoordination;
using sdk_detail::after;
using sdk_detail::errorOf;
using sdk_detail::ServiceConnections;

namespace {

// The connection has ended, whether before or after it was asked for the access's end.
bool isOfConnection(const QXError& error) {
  if (error.domain != kConsumerErrorDomain) return false;
  const auto code = static_cast<ConsumerErrorCode>(error.code);
  return code == ConsumerErrorCode::unreachable || code == ConsumerErrorCode::connectionLost;
}

// This process's other requests leave no room on the connection: the daemon was not asked.
bool isForWantOfRoom(const QXError& error) {
  return error.domain == kQXRpcErrorDomain && error.code == static_cast<std::int64_t>(QXRpcErrorCode::tooManyCalls);
}

constexpr int kMostTries = 100;
constexpr std::chrono::milliseconds kPause{10};

}  // namespace

CoordinatedAccess::CoordinatedAccess(std::shared_ptr<ServiceConnections> services, std::shared_ptr<sdk_detail::Connection> connection,
                                     const QXUUID& accessID, QXURL url, std::chrono::milliseconds deadline)
    : services_(std::move(services)), connection_(std::move(connection)), accessID_(accessID), url_(std::move(url)), deadline_(deadline) {}

CoordinatedAccess::CoordinatedAccess(CoordinatedAccess&& other) noexcept = default;

CoordinatedAccess& CoordinatedAccess::operator=(CoordinatedAccess&& other) noexcept {
  if (this == &other) return *this;
  (void)end();
  services_ = std::move(other.services_);
  connection_ = std::move(other.connection_);
  accessID_ = other.accessID_;
  url_ = std::move(other.url_);
  deadline_ = other.deadline_;
  return *this;
}

CoordinatedAccess::~CoordinatedAccess() { (void)end(); }

bool CoordinatedAccess::isHeld() const { return connection_ && !connection_->hasEnded; }

Failure CoordinatedAccess::end() {
  const auto connection = std::exchange(connection_, nullptr);
  if (!connection) return std::nullopt;
  const auto until = after(deadline_);
  const auto ask = [&] { return errorOf(ServiceConnections::askOver<&QXFileCoordination::endAccess>(*connection, {until}, accessID_)); };
  auto failure = ask();
  for (int tries = 1; tries < kMostTries && failure && isForWantOfRoom(*failure); ++tries) {
    std::this_thread::sleep_for(kPause);
    failure = ask();
  }
  if (failure && isForWantOfRoom(*failure)) connection->endpoint->close(*failure);
  if (!failure || !isOfConnection(*failure)) return failure;
  QXError lost = makeConsumerError(ConsumerErrorCode::connectionLost, "The access ended with its connection to the Docuvend daemon.");
  lost.underlying = failure->underlying;
  return lost;
}

}  // namespace docuvend
