// The descriptors that a peer which is not trusted is to be answered with over its connections, or was, and has not taken.
//
// Each is a file that this process keeps open until the socket takes it, and that counts from then on among those of its user that lie in
// sockets: the system passes none on to anybody when there are too many. It counts from before it is opened until the peer has taken it or
// has closed its end, also when this end has closed the connection long before; a socket that holds any is therefore kept here, so that it
// can be looked at. May be used from any thread.
#pragma once

#include <cstddef>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <utility>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

class UntakenDescriptors : public std::enable_shared_from_this<UntakenDescriptors> {
 public:
  using Socket = std::shared_ptr<const UniqueDescriptor>;

  // One answer's. Dropped before it was sent, it counts no more.
  class Share {
   public:
    Share(std::shared_ptr<UntakenDescriptors> all, Socket socket, std::size_t count)
        : all_(std::move(all)), socket_(std::move(socket)), count_(count) {}
    Share(const Share&) = delete;
    Share& operator=(const Share&) = delete;
    ~Share() { all_->leave(socket_, count_, isSent_); }

    // The socket has taken the frame.
    void setSent() { isSent_ = true; }

   private:
    const std::shared_ptr<UntakenDescriptors> all_;
    const Socket socket_;
    const std::size_t count_;
    bool isSent_ = false;
  };

  // `limit` is of all the peer's connections together.
  explicit UntakenDescriptors(std::size_t limit) : limit_(limit) {}

  // For an answer that is to go over that socket with so many of them. None when there is no room.
  [[nodiscard]] std::unique_ptr<Share> take(const Socket& socket, std::size_t count);

  enum class Room {
    free,
    waitsForAnswers,  // none before some are sent, or dropped
    waitsForPeer,     // none before the peer takes some: the socket, with the narrowest of buffers, is not writable until it has
  };
  // What one connection has: it may have kMaximumUntakenAnswers.
  [[nodiscard]] Room roomOf(const Socket& socket);
  // Whether there are none, and no socket is kept.
  [[nodiscard]] bool isEmpty();

 private:
  struct OfSocket {
    std::size_t due = 0;           // answers that it has not been given
    std::deque<std::size_t> sent;  // the descriptors of each answer that lies in it, in their order
  };
  void leave(const Socket& socket, std::size_t count, bool isSent);

  // With the mutex held.
  void syncLookAt(const UniqueDescriptor& socket, OfSocket& of);
  void syncLookAtAll();

  const std::size_t limit_;

  std::mutex mutex_;  // guards the rest
  std::map<Socket, OfSocket> sockets_;
  std::size_t count_ = 0;  // in all of them, and on the way to them
};

}  // namespace docuvend::linux_platform
