#include "platform/linux/rpc/LinuxRpcListener.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/socket.h>

#include <cerrno>
#include <chrono>
#include <thread>
#include <utility>
#include <vector>

#include "platform/QXLogMessage.h"
#include "platform/linux/base/PassedDescriptors.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kAcceptsAtATime = 16;
constexpr std::chrono::milliseconds kPauseWithoutDescriptors{100};

UniqueDescriptor spareDescriptor() { return UniqueDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC)); }

QXError refusal(std::string description) { return qxRpcError(QXRpcErrorCode::refused, std::move(description)); }

// What a peer's connections are counted by.
std::string countedAs(const PeerIdentity& peer) {
  if (peer.standing == Standing::nobody) return "processes without an identity";
  if (peer.standing == Standing::confined && peer.bundleIdentifier) return *peer.bundleIdentifier;
  return "unconfined processes";
}

ConnectionLimiter::Limits limitsFor(const PeerIdentity& peer) {
  switch (peer.standing) {
    case Standing::nobody:
      return {kMaximumConnectionsOfNobody, {kMaximumCallsOfNobody, kMaximumCallBytesPerPeer}};
    case Standing::unconfined:
      return {kMaximumUnconfinedConnections, {kMaximumUnconfinedCalls, kMaximumUnconfinedCallBytes}};
    case Standing::confined:
      break;
  }
  return {kMaximumConnectionsPerPeer, {kMaximumCallsPerPeer, kMaximumCallBytesPerPeer}};
}

// Whose lines are kept from filling the log: those of peers that are not trusted.
LogSubject::Name logSubjectFor(const PeerIdentity& peer) {
  return peer.standing == Standing::unconfined ? nullptr : std::make_shared<const std::string>(countedAs(peer));
}

}  // namespace

LinuxRpcListener::LinuxRpcListener(Surroundings surroundings, Service service, std::unique_ptr<BoundSocket> socket)
    : surroundings_(std::move(surroundings)),
      service_(std::move(service)),
      ownSocket_(std::move(socket)),
      socket_(ownSocket_->descriptor()),
      spare_(spareDescriptor()) {}

LinuxRpcListener::LinuxRpcListener(Surroundings surroundings, Service service, UniqueDescriptor passedSocket)
    : surroundings_(std::move(surroundings)),
      service_(std::move(service)),
      passedSocket_(std::move(passedSocket)),
      socket_(passedSocket_.get()),
      spare_(spareDescriptor()) {
  static_cast<void>(refusePassedDescriptors(socket_));
  static_cast<void>(::listen(socket_, kMaximumWaitingConnections));  // it listens already, perhaps with a longer line
}

LinuxRpcListener::~LinuxRpcListener() { registration_.reset(); }

void LinuxRpcListener::setDelegate(std::weak_ptr<QXRpcListenerDelegate> delegate) {
  const std::lock_guard lock(mutex_);
  delegate_ = std::move(delegate);
}

void LinuxRpcListener::resume() {
  const std::lock_guard lock(mutex_);
  if (registration_) return;
  registration_ = surroundings_.reactor.watch(socket_, EPOLLIN, [weak = weak_from_this()](std::uint32_t) -> std::uint32_t {
    const auto strongSelf = weak.lock();
    if (!strongSelf) return 0;
    strongSelf->acceptWaiting();
    return EPOLLIN;
  });
  if (!registration_) qxLog(surroundings_.log, "[ERROR] A listener's socket cannot be watched.");
}

void LinuxRpcListener::acceptWaiting() {
  for (int i = 0; i < kAcceptsAtATime; ++i) {
    if (!acceptOne()) return;
  }
}

// False when nobody waits.
bool LinuxRpcListener::acceptOne() {
  UniqueDescriptor socket(::accept4(socket_, nullptr, nullptr, SOCK_CLOEXEC));
  if (socket) {
    admit(std::move(socket));
    return true;
  }
  switch (errno) {
    case EINTR:
    case ECONNABORTED:
      return true;
    case EMFILE:
    case ENFILE:
    case ENOBUFS:
    case ENOMEM:
      acceptAndDrop(errno);
      return false;
    default:
      return false;
  }
}

// Without a descriptor for it the client would stay first in line for ever and keep a thread busy: it gets the spare one, and is dropped.
// Where even that is of no use, this thread waits a little, so that others may release something.
void LinuxRpcListener::acceptAndDrop(int errnoValue) {
  tellOfStarvation(QXError::system(errnoValue, "cannot accept"));
  spare_.reset();
  const bool dropped = static_cast<bool>(UniqueDescriptor(::accept4(socket_, nullptr, nullptr, SOCK_CLOEXEC)));
  spare_ = spareDescriptor();
  if (!dropped) std::this_thread::sleep_for(kPauseWithoutDescriptors);
}

void LinuxRpcListener::tellOfStarvation(const QXError& error) {
  if (std::exchange(isStarved_, true)) return;
  qxLog(surroundings_.log, "[NOTICE] Refusing connections: %@", error.texts.at("description"));
}

void LinuxRpcListener::admit(UniqueDescriptor socket) {
  auto peer = surroundings_.peers.identify(socket.get());
  if (!peer) {
    tellOfStarvation(QXError::system(EMFILE, "cannot look at who connects"));
    refuse(std::move(socket), qxRpcError(QXRpcErrorCode::tooManyCalls, "no descriptors are left to see who connects with"));
    return;
  }
  isStarved_ = false;
  const LogSubject subject(logSubjectFor(*peer));
  if (!isFor(*peer)) {
    refuseOutsider(*peer, std::move(socket));
    return;
  }
  const std::string counted = countedAs(*peer);
  const int process = peer->pid;
  const ConnectionLimiter::Limits limits = limitsFor(*peer);
  auto admission = surroundings_.limiter->admit(counted, limits);
  if (admission.verdict != ConnectionLimiter::Verdict::admitted) {
    if (admission.verdict == ConnectionLimiter::Verdict::refused) {
      qxLog(surroundings_.log, "[NOTICE] Refusing a connection of PID %d: %@ may not open more than %d.", process, counted,
            limits.connections);
    }
    refuse(std::move(socket), refusal("too many connections"));
    return;
  }
  CallRules rules = rulesFor(*peer, admission);
  const std::uint64_t number = nextNumber_++;
  auto connection = LinuxRpcConnection::create(surroundings_.reactor, surroundings_.peers, surroundings_.log, peer, std::move(socket),
                                               std::move(rules), service_.straightBelow, [weak = weak_from_this(), number](const QXError&) {
                                                 if (const auto strongSelf = weak.lock()) strongSelf->forget(number);
                                               });
  {
    const std::lock_guard lock(mutex_);
    accepted_.emplace(number, Accepted{connection, peer, std::move(admission.place)});
  }
  // Its bundle may have gone since the peer was looked at, and the others of that bundle been ended before this one was among them.
  if (!surroundings_.peers.isCurrent(*peer)) return end(*connection, *peer);
  offer(connection);
}

void LinuxRpcListener::endOutdated() {
  std::vector<std::pair<std::shared_ptr<LinuxRpcConnection>, std::shared_ptr<const PeerIdentity>>> all;
  {
    const std::lock_guard lock(mutex_);
    for (const auto& [number, accepted] : accepted_) all.emplace_back(accepted.connection, accepted.peer);
  }
  for (const auto& [connection, peer] : all) {
    if (!surroundings_.peers.isCurrent(*peer)) end(*connection, *peer);
  }
}

void LinuxRpcListener::end(LinuxRpcConnection& connection, const PeerIdentity& peer) const {
  const LogSubject subject(logSubjectFor(peer));
  const std::string bundle = countedAs(peer);
  connection.close(refusal("its bundle " + bundle + " was removed or replaced"));
  qxLog(surroundings_.log, "[NOTICE] Closing the connection of PID %d: its bundle %@ was removed or replaced.", peer.pid, bundle);
}

// A declared bundle changes nothing here: it comes later, and only from an unconfined process.
bool LinuxRpcListener::isFor(const PeerIdentity& peer) const {
  return service_.audience == Audience::everyone || peer.standing == Standing::unconfined;
}

CallRules LinuxRpcListener::rulesFor(const PeerIdentity& peer, ConnectionLimiter::Admission& admission) const {
  CallRules rules{std::move(admission.budget), /*operations=*/{}, service_.releasing, LogSubject::current(), /*lane=*/{}, /*untaken=*/{}};
  if (peer.standing == Standing::nobody) rules.operations = service_.operationsForNobody;
  if (peer.standing != Standing::unconfined) {
    rules.lane = std::move(admission.lane);
    rules.untaken = std::move(admission.untaken);
  }
  return rules;
}

void LinuxRpcListener::refuseOutsider(const PeerIdentity& peer, UniqueDescriptor socket) {
  const std::string counted = countedAs(peer);
  if (outsiders_.isDue(counted, std::chrono::steady_clock::now())) {
    qxLog(surroundings_.log, "[NOTICE] Refusing a connection of PID %d: %@ is not for %@.", peer.pid, service_.name, counted);
  }
  refuse(std::move(socket), refusal(service_.name + " is for unconfined processes alone"));
}

void LinuxRpcListener::refuse(UniqueDescriptor socket, const QXError& reason) const {
  Endpoint::create(surroundings_.reactor, std::move(socket), Hello{}, {})->close(reason);
}

void LinuxRpcListener::offer(const std::shared_ptr<LinuxRpcConnection>& connection) {
  std::shared_ptr<QXRpcListenerDelegate> delegate;
  {
    const std::lock_guard lock(mutex_);
    delegate = delegate_.lock();
  }
  if (!delegate || !delegate->listener(*this, connection)) connection->close(refusal("the service does not accept this connection"));
}

void LinuxRpcListener::forget(std::uint64_t number) {
  Accepted ended;  // goes after the lock
  const std::lock_guard lock(mutex_);
  const auto found = accepted_.find(number);
  if (found == accepted_.end()) return;
  ended = std::move(found->second);
  accepted_.erase(found);
}

}  // namespace docuvend::linux_platform
