#include "platform/linux/wire/Endpoint.h"

#include <sys/epoll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cassert>
#include <cerrno>
#include <cstdint>
#include <mutex>
#include <utility>
#include <vector>

#include "platform/linux/wire/FrameReader.h"
#include "platform/linux/wire/FrameWriter.h"
#include "platform/linux/wire/IncomingCalls.h"
#include "platform/linux/wire/Limits.h"
#include "platform/linux/wire/OutgoingCalls.h"

// The life of a connection.
//
// Reading belongs to the one thread on which the reactor runs the socket's handler: it takes what is there, and runs every whole frame
// before the socket is armed again. Writing belongs to whoever holds the mutex: frames are numbered, put in line and offered to the socket
// under it, so that numbers rise on the wire; what the socket does not take waits for its readiness. A peer that lets more than the
// bound pile up is dropped. It is not for what this end asks of it, perhaps in the name of others: while half of that lies there already,
// a message that would add to it is not sent. So the other half at least is the answers that the peer asked for and does not take.
//
// No handler is called with the mutex held. Replies and failures that arrive run on the reading thread; failures that this end finds by
// itself, also those of the connection's end, are posted to the reactor, so that nobody is called back from inside `send` or `close`.
//
// The end comes once. Whoever brings it about takes everything out under the mutex: waiting calls, exported object, registration,
// socket. A reading thread that is still at work has its own hold on the socket, so the descriptor's number is not reused under it. A
// socket that cannot be written any more is not the end yet: what the peer said last, perhaps why it left, is still to be read.

namespace docuvend::linux_platform {
namespace {

constexpr std::uint32_t kReadable = EPOLLIN;
constexpr std::uint32_t kWritable = EPOLLOUT;

QXError failure(QXRpcErrorCode code, std::string description) {
  return QXError::make(kQXRpcErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

enum class Farewell { tellPeer, silent };
enum class Cause {
  ordinary,
  neverTaken,  // the peer left without its hello, which it says before all else: it has run nothing
  misbehaviour,
};

}  // namespace

class Endpoint::State final : public AnswerSink, public std::enable_shared_from_this<State> {
 public:
  State(Reactor& reactor, UniqueDescriptor socket, Handlers handlers, CallRules rules)
      : incoming(std::move(rules)),
        reactor_(reactor),
        post_(reactor.poster()),
        handlers_(std::move(handlers)),
        socket_(std::make_shared<const UniqueDescriptor>(std::move(socket))) {}

  void sendHello(Hello hello);
  void resume();
  void send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply, std::shared_ptr<const FailureHandler> failureHandler);
  void sendReply(ReplyFrame reply) override;
  void sendFailure(FailureFrame failure) override;
  void ping(std::function<void()> onPong);
  [[nodiscard]] bool awaitsAnswers();
  void close(const QXError& reason, Farewell farewell, Cause cause = Cause::ordinary);

  IncomingCalls incoming;

 private:
  enum class Delivery { underway, overBound, refused };

  // On the reading thread.
  std::uint32_t ready(std::uint32_t events);
  void read(int socket);
  void runFrames();
  void run(Hello hello);
  void run(RequestFrame request);
  void run(ReplyFrame reply);
  void run(FailureFrame failure);
  void run(EndFrame end) { closeForPeer(end.error); }
  void run(PingFrame ping);
  void run(PongFrame pong);
  // The message that an answer is for, taken out. None when it has been answered before, or was never sent: then the connection ends.
  std::optional<OutgoingCalls::Call> settle(std::uint64_t callID);
  void closeMalformed(const Malformed& malformed);
  // The peer has ended the connection.
  void closeForPeer(const QXError& reason);

  // With the mutex held.
  Delivery write();
  [[nodiscard]] bool hasRoomFor(const EncodedFrame& request) const;

  void write(const Frame& frame);
  // Ends the connection when the peer cannot be given what is due to it; it would wait for ever.
  void closeUnlessUnderway(Delivery delivery);
  std::shared_ptr<const UniqueDescriptor> openSocket();
  void postFailure(std::shared_ptr<const FailureHandler> failureHandler, QXError error, MessageFate fate) const;

  Reactor& reactor_;  // used in `resume` alone: it may be gone later
  const Reactor::Poster post_;
  const Handlers handlers_;

  // Only on the reading thread.
  FrameReader reader_;
  bool peerSaidHello_ = false;
  std::uint64_t lastRequest_ = 0;

  std::mutex mutex_;  // guards the rest
  std::shared_ptr<const UniqueDescriptor> socket_;
  std::shared_ptr<Reactor::Registration> registration_;
  FrameWriter writer_;
  bool writingIsOver_ = false;
  OutgoingCalls outgoing_;
  std::function<void()> onPong_;    // empty: none is awaited
  std::uint64_t lastPongsEnd_ = 0;  // in the writer's stream
  std::optional<QXError> closed_;
};

class Endpoint::Proxy final : public QXRpcProxy {
 public:
  Proxy(std::shared_ptr<Endpoint> endpoint, FailureHandler failureHandler)
      : endpoint_(std::move(endpoint)), failureHandler_(std::make_shared<const FailureHandler>(std::move(failureHandler))) {}

  void send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) override {
    const bool isForSomebody = LogSubject::current() != nullptr;
    endpoint_->state_->send(
        operation, std::move(arguments), LogSubject::carrying(std::move(reply)),
        isForSomebody ? std::make_shared<const FailureHandler>(LogSubject::carrying(*failureHandler_)) : failureHandler_);
  }

 private:
  const std::shared_ptr<Endpoint> endpoint_;
  const std::shared_ptr<const FailureHandler> failureHandler_;
};

void Endpoint::State::sendHello(Hello hello) {
  if (hello.version == 0) hello.version = kProtocolVersion;
  write(Frame(std::move(hello)));
}

void Endpoint::State::resume() {
  bool refused = false;
  {
    const std::lock_guard lock(mutex_);
    if (closed_ || registration_) return;
    const std::uint32_t events = kReadable | (writer_.pendingBytes() > 0 ? kWritable : 0);
    registration_ = reactor_.watch(socket_->get(), events, [weak = weak_from_this()](std::uint32_t ready) -> std::uint32_t {
      const auto state = weak.lock();
      return state ? state->ready(ready) : 0;
    });
    refused = !registration_;
  }
  if (refused) close(QXError::system(ENOMEM, "cannot watch a socket"), Farewell::tellPeer);
}

std::shared_ptr<const UniqueDescriptor> Endpoint::State::openSocket() {
  const std::lock_guard lock(mutex_);
  return closed_ ? nullptr : socket_;
}

std::uint32_t Endpoint::State::ready(std::uint32_t events) {
  const auto socket = openSocket();
  if (!socket) return 0;
  if ((events & ~kWritable) != 0) read(socket->get());
  Delivery delivery = Delivery::underway;
  std::uint32_t wanted = kReadable;
  {
    const std::lock_guard lock(mutex_);
    if (closed_) return 0;
    delivery = write();
    if (writer_.pendingBytes() > 0 && !writingIsOver_) wanted |= kWritable;
  }
  closeUnlessUnderway(delivery);
  return wanted;
}

void Endpoint::State::read(int socket) {
  auto reading = reader_.read(socket);
  if (std::holds_alternative<FrameReader::Got>(reading)) {
    runFrames();
  } else if (const auto* malformed = std::get_if<Malformed>(&reading)) {
    closeMalformed(*malformed);
  } else if (const auto* failed = std::get_if<FrameReader::Failed>(&reading)) {
    closeForPeer(QXError::system(failed->errnoValue, failed->errnoValue == ECONNRESET ? "the peer left" : "cannot read"));
  } else if (std::holds_alternative<FrameReader::Ended>(reading)) {
    if (reader_.insideFrame()) {
      closeMalformed({"the connection ended inside a frame"});
    } else {
      closeForPeer(QXError::system(ECONNRESET, "the peer left"));
    }
  }
}

void Endpoint::State::runFrames() {
  while (openSocket()) {
    auto next = reader_.next();
    if (std::holds_alternative<FrameReader::Incomplete>(next)) return;
    if (const auto* malformed = std::get_if<Malformed>(&next)) {
      closeMalformed(*malformed);
      return;
    }
    auto& frame = std::get<Frame>(next);
    if (!peerSaidHello_ && !std::holds_alternative<Hello>(frame) && !std::holds_alternative<EndFrame>(frame)) {
      closeMalformed({"a frame before the hello"});
      return;
    }
    std::visit([this](auto& given) { run(std::move(given)); }, frame);
  }
}

void Endpoint::State::run(Hello hello) {
  if (peerSaidHello_) {
    closeMalformed({"a second hello"});
    return;
  }
  if (hello.version != kProtocolVersion) {
    close(failure(QXRpcErrorCode::unsupportedVersion, "version " + std::to_string(hello.version) + " of the protocol is not supported"),
          Farewell::tellPeer, Cause::misbehaviour);
    return;
  }
  peerSaidHello_ = true;
  if (!handlers_.onHello) return;
  if (const auto error = handlers_.onHello(hello)) close(*error, Farewell::tellPeer);
}

void Endpoint::State::run(RequestFrame request) {
  if (request.callID <= lastRequest_) {
    closeMalformed({"a request whose number does not rise"});
    return;
  }
  lastRequest_ = request.callID;
  incoming.run(std::move(request), reader_.frameBytes(), shared_from_this());
}

std::optional<OutgoingCalls::Call> Endpoint::State::settle(std::uint64_t callID) {
  OutgoingCalls::Forgotten forgotten;
  std::optional<OutgoingCalls::Call> call;
  bool issued = false;
  {
    const std::lock_guard lock(mutex_);
    issued = outgoing_.wasIssued(callID);
    call = outgoing_.settle(callID, forgotten);
  }
  if (!issued) closeMalformed({"an answer to a request that was not made"});
  return call;
}

void Endpoint::State::run(ReplyFrame reply) {
  const auto call = settle(reply.callID);
  if (!call || !call->reply) return;
  if (const auto mismatch = qxMismatch(call->replies, reply.values)) {
    if (*call->failureHandler) (*call->failureHandler)(failure(QXRpcErrorCode::invalidReply, *mismatch), MessageFate::refused);
  } else {
    call->reply(std::move(reply.values));
  }
}

void Endpoint::State::run(FailureFrame failure) {
  const auto call = settle(failure.callID);
  if (call && *call->failureHandler) (*call->failureHandler)(failure.error, MessageFate::refused);
}

// A pong that has not left yet is all that a peer may make this end keep: one that takes them may ask as often as it likes.
void Endpoint::State::run(PingFrame) {
  const auto pong = std::get<EncodedFrame>(encodeFrame(PongFrame{}));
  Delivery delivery = Delivery::underway;
  bool isTooEarly = false;
  {
    const std::lock_guard lock(mutex_);
    if (closed_) return;
    isTooEarly = !writer_.isTaken(lastPongsEnd_);
    if (!isTooEarly) {
      writer_.add(pong);
      lastPongsEnd_ = writer_.position();
      delivery = write();
    }
  }
  if (isTooEarly) closeMalformed({"a ping before the last one's answer was taken"});
  closeUnlessUnderway(delivery);
}

void Endpoint::State::run(PongFrame) {
  std::function<void()> onPong;
  {
    const std::lock_guard lock(mutex_);
    onPong.swap(onPong_);
  }
  if (onPong) {
    onPong();
  } else {
    closeMalformed({"an answer to a ping that was not sent"});
  }
}

void Endpoint::State::ping(std::function<void()> onPong) {
  assert(onPong);
  {
    const std::lock_guard lock(mutex_);
    if (closed_) return;
    assert(!onPong_);
    onPong_ = std::move(onPong);
  }
  write(Frame(PingFrame{}));
}

bool Endpoint::State::awaitsAnswers() {
  const std::lock_guard lock(mutex_);
  return outgoing_.awaitsReplies();
}

void Endpoint::State::closeForPeer(const QXError& reason) {
  close(reason, Farewell::silent, peerSaidHello_ ? Cause::ordinary : Cause::neverTaken);
}

void Endpoint::State::closeMalformed(const Malformed& malformed) {
  close(failure(QXRpcErrorCode::malformedFrame, malformed.reason), Farewell::tellPeer, Cause::misbehaviour);
}

void Endpoint::State::send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply,
                           std::shared_ptr<const FailureHandler> failureHandler) {
  const bool wantsReply = static_cast<bool>(reply);
  RequestFrame request{0, wantsReply, operation.name, std::move(arguments)};
  OutgoingCalls::Forgotten forgotten;
  std::optional<QXError> problem;
  MessageFate fate = MessageFate::refused;
  Delivery delivery = Delivery::underway;
  {
    const std::lock_guard lock(mutex_);
    if (closed_) {
      problem = closed_;
      fate = MessageFate::unsent;
    } else if (wantsReply && outgoing_.isFull()) {
      problem = failure(QXRpcErrorCode::tooManyCalls, "too many messages wait for their answers");
    } else {
      request.callID = outgoing_.nextID();
      auto encoded = encodeFrame(std::move(request));
      if (const auto* malformed = std::get_if<Malformed>(&encoded)) {
        problem = failure(QXRpcErrorCode::notTransmissible, malformed->reason);
      } else if (!hasRoomFor(std::get<EncodedFrame>(encoded))) {
        problem = failure(QXRpcErrorCode::tooManyCalls, "the peer has not taken yet what was sent to it before");
      } else {
        writer_.add(std::get<EncodedFrame>(std::move(encoded)), outgoing_.nextID());
        outgoing_.add({operation.replies, std::move(reply), failureHandler}, forgotten);
        delivery = write();
      }
    }
  }
  if (problem) postFailure(std::move(failureHandler), *std::move(problem), fate);
  closeUnlessUnderway(delivery);
}

void Endpoint::State::sendReply(ReplyFrame reply) {
  const std::uint64_t callID = reply.callID;
  auto encoded = encodeFrame(std::move(reply));
  if (const auto* malformed = std::get_if<Malformed>(&encoded)) {
    sendFailure({callID, failure(QXRpcErrorCode::invalidReply, malformed->reason)});
    return;
  }
  Delivery delivery = Delivery::underway;
  {
    const std::lock_guard lock(mutex_);
    if (closed_) return;
    writer_.add(std::get<EncodedFrame>(std::move(encoded)));
    delivery = write();
  }
  closeUnlessUnderway(delivery);
}

void Endpoint::State::sendFailure(FailureFrame failure) { write(Frame(std::move(failure))); }

// For frames whose contents are this end's own and short.
void Endpoint::State::write(const Frame& frame) {
  auto encoded = encodeFrame(frame);
  auto* bytes = std::get_if<EncodedFrame>(&encoded);
  if (bytes == nullptr) {
    close(failure(QXRpcErrorCode::notTransmissible, std::get<Malformed>(encoded).reason), Farewell::silent);
    return;
  }
  Delivery delivery = Delivery::underway;
  {
    const std::lock_guard lock(mutex_);
    if (closed_) return;
    writer_.add(std::move(*bytes));
    delivery = write();
  }
  closeUnlessUnderway(delivery);
}

Endpoint::State::Delivery Endpoint::State::write() {
  if (!writingIsOver_) {
    const auto progress = writer_.write(socket_->get());
    writingIsOver_ = progress == FrameWriter::Progress::broken;
    if (progress == FrameWriter::Progress::refused) return Delivery::refused;
    if (progress == FrameWriter::Progress::blocked && registration_) registration_->rearm(kWritable);
  }
  return writer_.pendingBytes() > kMaximumOutputBytes ? Delivery::overBound : Delivery::underway;
}

bool Endpoint::State::hasRoomFor(const EncodedFrame& request) const {
  static_assert(kMaximumOutputBeforeRequest > kFrameLengthBytes + kMaximumFrameBytes, "one that finds nothing before it has room");
  return writer_.pendingBytes() + request.bytes.size() <= kMaximumOutputBeforeRequest;
}

void Endpoint::State::closeUnlessUnderway(Delivery delivery) {
  if (delivery == Delivery::overBound) {
    close(failure(QXRpcErrorCode::peerDoesNotRead, "the peer does not read what is sent to it"), Farewell::silent, Cause::misbehaviour);
  } else if (delivery == Delivery::refused) {
    close(QXError::system(ETOOMANYREFS, "the system passes no more descriptors on"), Farewell::silent);
  }
}

void Endpoint::State::postFailure(std::shared_ptr<const FailureHandler> failureHandler, QXError error, MessageFate fate) const {
  if (!*failureHandler) return;
  post_([failureHandler = std::move(failureHandler), error = std::move(error), fate] { (*failureHandler)(error, fate); });
}

void Endpoint::State::close(const QXError& reason, Farewell farewell, Cause cause) {
  std::shared_ptr<Reactor::Registration> registration;
  std::shared_ptr<const UniqueDescriptor> socket;
  std::vector<OutgoingCalls::Lost> failed;
  OutgoingCalls::Forgotten forgotten;
  std::function<void()> unheardPong;
  {
    const std::lock_guard lock(mutex_);
    if (closed_) return;
    closed_ = reason;
    unheardPong.swap(onPong_);
    failed = outgoing_.settleAll(writer_.unwritten(), forgotten);
    if (cause == Cause::neverTaken) {
      for (auto& lost : failed) lost.fate = MessageFate::unsent;
    }
    if (farewell == Farewell::tellPeer && !writingIsOver_) {
      auto encoded = encodeFrame(EndFrame{reason});
      if (auto* bytes = std::get_if<EncodedFrame>(&encoded)) {
        writer_.add(std::move(*bytes));
        static_cast<void>(writer_.write(socket_->get()));  // what it does not take now is lost: the peer then learns only of the end
      }
    }
    writer_ = {};
    registration.swap(registration_);
    socket.swap(socket_);
    ::shutdown(socket->get(), SHUT_RDWR);
  }
  registration.reset();  // while the socket is still held: its number must not be another's
  incoming.release();
  unheardPong = nullptr;
  post_([failed = std::move(failed), blame = cause == Cause::misbehaviour ? handlers_.onMisbehaviour : nullptr, onClose = handlers_.onClose,
         reason] {
    if (blame) blame(reason);
    for (const auto& [call, fate] : failed) {
      if (*call.failureHandler) (*call.failureHandler)(reason, fate);
    }
    if (onClose) onClose(reason);
  });
}

Endpoint::Endpoint(std::shared_ptr<State> state) : state_(std::move(state)) {}

Endpoint::~Endpoint() { state_->close(QXError::system(ECONNABORTED, "the connection was released"), Farewell::silent); }

std::shared_ptr<Endpoint> Endpoint::create(Reactor& reactor, UniqueDescriptor socket, Hello hello, Handlers handlers, CallRules rules) {
  auto state = std::make_shared<State>(reactor, std::move(socket), std::move(handlers), std::move(rules));
  auto endpoint = std::shared_ptr<Endpoint>(new Endpoint(state));
  state->sendHello(std::move(hello));
  return endpoint;
}

void Endpoint::setExportedInterface(QXRpcInterface interface) { state_->incoming.setInterface(std::move(interface)); }

void Endpoint::setExportedObject(std::shared_ptr<QXRpcExportedObject> object) { state_->incoming.setObject(std::move(object)); }

void Endpoint::resume() { state_->resume(); }

std::shared_ptr<QXRpcProxy> Endpoint::remoteObjectProxy(QXErrorHandler errorHandler) {
  FailureHandler failureHandler;
  if (errorHandler) failureHandler = [errorHandler = std::move(errorHandler)](const QXError& error, MessageFate) { errorHandler(error); };
  return remoteObjectProxy(std::move(failureHandler));
}

std::shared_ptr<QXRpcProxy> Endpoint::remoteObjectProxy(FailureHandler failureHandler) {
  return std::make_shared<Proxy>(shared_from_this(), std::move(failureHandler));
}

void Endpoint::ping(std::function<void()> onPong) { state_->ping(std::move(onPong)); }

bool Endpoint::awaitsAnswers() const { return state_->awaitsAnswers(); }

void Endpoint::close(const QXError& reason) { state_->close(reason, Farewell::tellPeer); }

}  // namespace docuvend::linux_platform
