// What a connection does on its reading thread: its turns, and what each kind of frame asks for.
#include <cerrno>
#include <chrono>
#include <string>
#include <utility>
#include <variant>

#include "platform/linux/wire/EndpointState.h"
#include "platform/linux/wire/Limits.h"

namespace docuvend::linux_platform {

std::uint32_t Endpoint::State::ready(std::uint32_t events) {
  const auto socket = openSocket();
  if (socket && isTakingAnswers()) {
    if (mayHoldFrames_) {
      runFrames();
    } else if ((events & ~kWritable) != 0) {
      read(socket->get());
    }
  }
  finishEnding();
  return wantedNext();
}

// Also offers the socket what waits for it.
std::uint32_t Endpoint::State::wantedNext() {
  Delivery delivery = Delivery::underway;
  std::uint32_t wanted = 0;
  {
    const std::lock_guard lock(mutex_);
    if (closed_) return 0;
    delivery = write();
    const auto room = syncRoom();
    isHeldUp_ = room != UntakenDescriptors::Room::free;
    const bool waitsForPeer = room == UntakenDescriptors::Room::waitsForPeer;
    if (waitsForPeer) {
      sendBuffer_.narrow(socket_->get());
    } else {
      sendBuffer_.widen(socket_->get());
    }
    if (writer_.pendingBytes() > 0 || waitsForPeer) wanted |= kWritable;
    if (syncIsTakingAnswers()) wanted |= mayHoldFrames_ ? Reactor::kAgain : kReadable;
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
  const auto end = std::chrono::steady_clock::now() + kTurn;
  do {
    if (!runNextFrame()) return;
  } while (std::chrono::steady_clock::now() < end && isTakingAnswers());
}

// False when there is none.
bool Endpoint::State::runNextFrame() {
  auto next = reader_.next();
  mayHoldFrames_ = std::holds_alternative<Frame>(next);
  if (const auto* malformed = std::get_if<Malformed>(&next)) closeMalformed(*malformed);
  if (!mayHoldFrames_) return false;
  auto& frame = std::get<Frame>(next);
  if (!peerSaidHello_ && !std::holds_alternative<Hello>(frame) && !std::holds_alternative<EndFrame>(frame)) {
    closeMalformed({"a frame before the hello"});
    return false;
  }
  std::visit([this](auto& given) { run(std::move(given)); }, frame);
  return true;
}

void Endpoint::State::run(Hello hello) {
  if (peerSaidHello_) {
    closeMalformed({"a second hello"});
    return;
  }
  if (hello.version != kProtocolVersion) {
    close(qxRpcError(QXRpcErrorCode::unsupportedVersion, "version " + std::to_string(hello.version) + " of the protocol is not supported"),
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
    if (*call->failureHandler) (*call->failureHandler)(qxRpcError(QXRpcErrorCode::invalidReply, *mismatch), MessageFate::refused);
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

void Endpoint::State::closeForPeer(const QXError& reason) {
  close(reason, Farewell::silent, peerSaidHello_ ? Cause::ordinary : Cause::neverTaken);
}

void Endpoint::State::closeMalformed(const Malformed& malformed) {
  close(qxRpcError(QXRpcErrorCode::malformedFrame, malformed.reason), Farewell::tellPeer, Cause::misbehaviour);
}

}  // namespace docuvend::linux_platform
