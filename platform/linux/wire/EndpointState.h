// One connection, from its hello to its end; the reactor may be at work in it when its endpoint is gone.
#pragma once

#include <sys/epoll.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/FrameReader.h"
#include "platform/linux/wire/FrameWriter.h"
#include "platform/linux/wire/IncomingCalls.h"
#include "platform/linux/wire/SendBuffer.h"

namespace docuvend::linux_platform {

class Endpoint::State final : public AnswerSink, public std::enable_shared_from_this<State> {
 public:
  enum class Farewell { tellPeer, silent };
  enum class Cause {
    ordinary,
    neverTaken,  // the peer left without its hello, which it says before all else: it has run nothing
    misbehaviour,
  };

  State(Reactor& reactor, UniqueDescriptor socket, Handlers handlers, CallRules rules)
      : incoming(rules),
        reactor_(reactor),
        post_(reactor.poster()),
        handlers_(std::move(handlers)),
        lane_(std::move(rules.lane)),
        untaken_(std::move(rules.untaken)),
        socket_(std::make_shared<const UniqueDescriptor>(std::move(socket))) {}

  void sendHello(Hello hello);
  void resume();
  void send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply, std::shared_ptr<const FailureHandler> failureHandler);
  std::unique_ptr<UntakenDescriptors::Share> reserve(std::size_t descriptors) override;
  void release(std::unique_ptr<UntakenDescriptors::Share> room) override;
  void sendReply(ReplyFrame reply, std::unique_ptr<UntakenDescriptors::Share> room) override;
  void sendFailure(FailureFrame failure) override;
  void ping(std::function<void()> onPong);
  [[nodiscard]] bool awaitsAnswers();
  // Which thread lets go of what the connection had: this one, or the reading one as soon as it has time.
  enum class Thread { calling, reading };
  void close(const QXError& reason, Farewell farewell, Cause cause = Cause::ordinary, Thread thread = Thread::calling);

  IncomingCalls incoming;

 private:
  static constexpr std::uint32_t kReadable = EPOLLIN;
  static constexpr std::uint32_t kWritable = EPOLLOUT;

  enum class Delivery { underway, overBound, refused };

  // What is taken out of a connection that is over.
  struct Ending {
    QXError reason;
    Cause cause;
    std::shared_ptr<Reactor::Registration> registration;
    std::shared_ptr<const UniqueDescriptor> socket;
    std::vector<OutgoingCalls::Lost> failed;
    OutgoingCalls::Forgotten forgotten;
    std::function<void()> unheardPong;
  };

  // On the reading thread.
  std::uint32_t ready(std::uint32_t events);
  std::uint32_t wantedNext();
  [[nodiscard]] bool isTakingAnswers();
  void read(int socket);
  void runFrames();
  bool runNextFrame();
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
  // What another thread has left to this one.
  void finishEnding();

  // With the mutex held.
  Delivery write();
  // Whether the answer, whose descriptors the system does not pass on, has been replaced by a failure; a request cannot be.
  [[nodiscard]] bool syncReplaceRefused();
  void syncAddFailure(std::uint64_t callID, QXError error);
  [[nodiscard]] bool syncIsTakingAnswers() const;
  [[nodiscard]] UntakenDescriptors::Room syncRoom() const;
  // Looks again whether there is room now.
  void syncGoOn();
  [[nodiscard]] bool hasRoomFor(const EncodedFrame& request) const;

  void write(const Frame& frame);
  // Ends the connection when the peer cannot be given what is due to it; it would wait for ever.
  void closeUnlessUnderway(Delivery delivery);
  void finish(Ending ending);
  std::shared_ptr<const UniqueDescriptor> openSocket();
  void postFailure(std::shared_ptr<const FailureHandler> failureHandler, QXError error, MessageFate fate) const;

  Reactor& reactor_;  // used in `resume` alone: it may be gone later
  const Reactor::Poster post_;
  const Handlers handlers_;
  const std::shared_ptr<Reactor::Lane> lane_;          // null: the peer is trusted
  const std::shared_ptr<UntakenDescriptors> untaken_;  // null: they are not counted

  // Only on the reading thread.
  FrameReader reader_;
  bool mayHoldFrames_ = false;  // the reader: its last turn ended before it was found empty
  bool peerSaidHello_ = false;
  std::uint64_t lastRequest_ = 0;

  std::mutex mutex_;  // guards the rest
  std::shared_ptr<const UniqueDescriptor> socket_;
  std::shared_ptr<Reactor::Registration> registration_;
  FrameWriter writer_;
  SendBuffer sendBuffer_;
  bool isHeldUp_ = false;  // for want of room for answers with descriptors
  OutgoingCalls outgoing_;
  std::function<void()> onPong_;    // empty: none is awaited
  std::uint64_t lastPongsEnd_ = 0;  // in the writer's stream
  std::optional<QXError> closed_;
  std::optional<Ending> ending_;  // left to the reading thread
};

}  // namespace docuvend::linux_platform
