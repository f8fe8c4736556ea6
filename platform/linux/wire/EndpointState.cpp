#include "platform/linux/wire/EndpointState.h"

#include <sys/socket.h>

#include <cassert>
#include <cerrno>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/wire/Limits.h"

// The life of a connection.
//
// Reading belongs to the one thread on which the reactor runs the socket's handler: it takes what is there, and runs every whole frame
// before the socket is armed again. When that takes long, others have their turn in between; when answers pile up at a peer that is not
// trusted, or files that it was given, its frames wait until it has taken them. (Never at one that is: two ends that wait so for each other
// would wait for ever.) For files that lie in the socket there is no event; but with the narrowest of buffers it becomes writable when no
// more than one or two are left.
//
// Writing belongs to whoever holds the mutex: frames are numbered, put in line and offered to the socket
// under it, so that numbers rise on the wire; what the socket does not take waits for its readiness. A peer that lets more than the
// bound pile up is dropped. It is not for what this end asks of it, perhaps in the name of others: while half of that lies there already,
// a message that would add to it is not sent. So the other half at least is the answers that the peer asked for and does not take.
//
// No handler is called with the mutex held. Replies and failures that arrive run on the reading thread; failures that this end finds by
// itself, also those of the connection's end, are posted to the reactor, so that nobody is called back from inside `send` or `close`.
//
// The end comes once. Whoever brings it about takes everything out under the mutex: waiting calls, registration, socket. Letting go of the
// exported object takes as long as its last users make it, so who must not wait for that leaves it to the reading thread. A reading thread
// that is still at work has its own hold on the socket, so the descriptor's number is not reused under it. A socket that cannot be written
// any more is not the end yet: what the peer has said by then, perhaps why it left, is still to be read. Nothing is kept for it any more,
// and it says nothing further: who takes no answers is not served on.

namespace docuvend::linux_platform {

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
    const auto handler = [weak = weak_from_this()](std::uint32_t ready) -> std::uint32_t {
      const auto state = weak.lock();
      return state ? state->ready(ready) : 0;
    };
    registration_ = reactor_.watch(socket_->get(), events, handler, lane_);
    refused = !registration_;
  }
  if (refused) close(QXError::system(ENOMEM, "cannot watch a socket"), Farewell::tellPeer);
}

std::shared_ptr<const UniqueDescriptor> Endpoint::State::openSocket() {
  const std::lock_guard lock(mutex_);
  return closed_ ? nullptr : socket_;
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
      problem = qxRpcError(QXRpcErrorCode::tooManyCalls, "too many messages wait for their answers");
    } else {
      request.callID = outgoing_.nextID();
      auto encoded = encodeFrame(std::move(request));
      if (const auto* malformed = std::get_if<Malformed>(&encoded)) {
        problem = qxRpcError(QXRpcErrorCode::notTransmissible, malformed->reason);
      } else if (!hasRoomFor(std::get<EncodedFrame>(encoded))) {
        problem = qxRpcError(QXRpcErrorCode::tooManyCalls, "the peer has not taken yet what was sent to it before");
      } else {
        writer_.add(std::get<EncodedFrame>(std::move(encoded)), {.request = outgoing_.nextID()});
        outgoing_.add({operation.replies, std::move(reply), failureHandler}, forgotten);
        delivery = write();
      }
    }
  }
  if (problem) postFailure(std::move(failureHandler), *std::move(problem), fate);
  closeUnlessUnderway(delivery);
}

std::unique_ptr<UntakenDescriptors::Share> Endpoint::State::reserve(std::size_t descriptors) {
  const auto socket = openSocket();
  return socket ? untaken_->take(socket, descriptors) : nullptr;
}

void Endpoint::State::release(std::unique_ptr<UntakenDescriptors::Share> room) {
  room.reset();
  const std::lock_guard lock(mutex_);
  syncGoOn();
}

void Endpoint::State::sendReply(ReplyFrame reply, std::unique_ptr<UntakenDescriptors::Share> room) {
  const std::uint64_t callID = reply.callID;
  auto encoded = encodeFrame(std::move(reply));
  if (const auto* malformed = std::get_if<Malformed>(&encoded)) {
    if (room) release(std::move(room));
    sendFailure({callID, qxRpcError(QXRpcErrorCode::invalidReply, malformed->reason)});
    return;
  }
  auto& frame = std::get<EncodedFrame>(encoded);
  if (frame.descriptors.empty()) room.reset();
  Delivery delivery = Delivery::underway;
  {
    const std::lock_guard lock(mutex_);
    if (closed_) return;
    writer_.add(std::move(frame), {.answerTo = callID}, std::move(room));
    delivery = write();
    syncGoOn();
  }
  closeUnlessUnderway(delivery);
}

void Endpoint::State::sendFailure(FailureFrame failure) { write(Frame(std::move(failure))); }

// For frames whose contents are this end's own and short.
void Endpoint::State::write(const Frame& frame) {
  auto encoded = encodeFrame(frame);
  auto* bytes = std::get_if<EncodedFrame>(&encoded);
  if (bytes == nullptr) {
    close(qxRpcError(QXRpcErrorCode::notTransmissible, std::get<Malformed>(encoded).reason), Farewell::silent);
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
  const bool wasOver = writer_.isOver();
  auto progress = writer_.write(socket_->get());
  while (progress == FrameWriter::Progress::refused) {
    if (!syncReplaceRefused()) return Delivery::refused;
    progress = writer_.write(socket_->get());
  }
  if (progress == FrameWriter::Progress::blocked && registration_) registration_->rearm(kWritable);
  if (progress == FrameWriter::Progress::over && !wasOver) ::shutdown(socket_->get(), SHUT_RD);
  return writer_.pendingBytes() > kMaximumOutputBytes ? Delivery::overBound : Delivery::underway;
}

bool Endpoint::State::syncReplaceRefused() {
  const std::uint64_t callID = writer_.dropRefused().answerTo;
  if (callID == 0) return false;
  syncAddFailure(callID, qxRpcError(QXRpcErrorCode::tooManyCalls, "the system passes no more open files on for now"));
  if (handlers_.onDescriptorsRefused) post_(handlers_.onDescriptorsRefused);
  return true;
}

void Endpoint::State::syncAddFailure(std::uint64_t callID, QXError error) {
  auto encoded = encodeFrame(FailureFrame{callID, std::move(error)});
  if (auto* frame = std::get_if<EncodedFrame>(&encoded)) writer_.add(std::move(*frame));
}

bool Endpoint::State::isTakingAnswers() {
  const std::lock_guard lock(mutex_);
  return !closed_ && syncIsTakingAnswers();
}

bool Endpoint::State::syncIsTakingAnswers() const {
  return !lane_ || (writer_.pendingBytes() <= kMaximumOutputBeforeFrame && syncRoom() == UntakenDescriptors::Room::free);
}

// One that cannot be written to any more has nothing to take.
UntakenDescriptors::Room Endpoint::State::syncRoom() const {
  return untaken_ && !writer_.isOver() ? untaken_->roomOf(socket_) : UntakenDescriptors::Room::free;
}

void Endpoint::State::syncGoOn() {
  if (isHeldUp_ && registration_) registration_->rearm(kWritable);
}

bool Endpoint::State::hasRoomFor(const EncodedFrame& request) const {
  static_assert(kMaximumOutputBeforeRequest > kFrameLengthBytes + kMaximumFrameBytes, "one that finds nothing before it has room");
  return writer_.pendingBytes() + request.bytes.size() <= kMaximumOutputBeforeRequest;
}

void Endpoint::State::closeUnlessUnderway(Delivery delivery) {
  if (delivery == Delivery::overBound) {
    close(qxRpcError(QXRpcErrorCode::peerDoesNotRead, "the peer does not read what is sent to it"), Farewell::silent, Cause::misbehaviour);
  } else if (delivery == Delivery::refused) {
    close(QXError::system(ETOOMANYREFS, "the system passes no more descriptors on"), Farewell::silent);
  }
}

void Endpoint::State::postFailure(std::shared_ptr<const FailureHandler> failureHandler, QXError error, MessageFate fate) const {
  if (!*failureHandler) return;
  post_([failureHandler = std::move(failureHandler), error = std::move(error), fate] { (*failureHandler)(error, fate); });
}

void Endpoint::State::close(const QXError& reason, Farewell farewell, Cause cause, Thread thread) {
  std::optional<Ending> ending;
  std::shared_ptr<Reactor::Registration> toBeWoken;
  {
    const std::lock_guard lock(mutex_);
    if (closed_) return;
    closed_ = reason;
    ending.emplace(Ending{reason, cause, {}, {}, {}, {}, {}});
    ending->unheardPong.swap(onPong_);
    ending->failed = outgoing_.settleAll(writer_.unwritten(), ending->forgotten);
    if (farewell == Farewell::tellPeer && !writer_.isOver()) {
      auto encoded = encodeFrame(EndFrame{reason});
      if (auto* bytes = std::get_if<EncodedFrame>(&encoded)) {
        writer_.add(std::move(*bytes));
        static_cast<void>(writer_.write(socket_->get()));  // what it does not take now is lost: the peer then learns only of the end
      }
    }
    writer_ = {};
    ending->registration.swap(registration_);
    ending->socket.swap(socket_);
    ::shutdown(ending->socket->get(), SHUT_RDWR);
    if (thread == Thread::reading && ending->registration) {
      toBeWoken = ending->registration;
      ending_.swap(ending);
    }
  }
  if (toBeWoken) {
    toBeWoken->rearm(kReadable);
  } else {
    finish(*std::move(ending));
  }
}

void Endpoint::State::finishEnding() {
  std::optional<Ending> ending;
  {
    const std::lock_guard lock(mutex_);
    ending.swap(ending_);
  }
  if (ending) finish(*std::move(ending));
}

void Endpoint::State::finish(Ending ending) {
  if (untaken_) static_cast<void>(untaken_->isEmpty());  // looks, and lets go of what need not be kept
  ending.registration.reset();                           // while the socket is still held: its number must not be another's
  incoming.release();
  ending.unheardPong = nullptr;
  if (ending.cause == Cause::neverTaken) {
    for (auto& lost : ending.failed) lost.fate = MessageFate::unsent;
  }
  post_([failed = std::move(ending.failed), blame = ending.cause == Cause::misbehaviour ? handlers_.onMisbehaviour : nullptr,
         onClose = handlers_.onClose, reason = std::move(ending.reason)] {
    if (blame) blame(reason);
    for (const auto& [call, fate] : failed) {
      if (*call.failureHandler) (*call.failureHandler)(reason, fate);
    }
    if (onClose) onClose(reason);
  });
}

}  // namespace docuvend::linux_platform
