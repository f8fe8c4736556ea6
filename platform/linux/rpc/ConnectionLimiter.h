// How many connections one peer may hold open, and how many requests, of how many bytes, it may have without an answer over all of them
// together. Limits of the second kind keep a peer from using up what the daemon may ask of a provider: they are well below that.
// Descriptors that a peer is sent are counted over all its connections in the same way. May be used from any thread.
#pragma once

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "platform/linux/wire/CallBudget.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/linux/wire/UntakenDescriptors.h"

namespace docuvend::linux_platform {

inline constexpr std::size_t kMaximumConnectionsPerPeer = 64;
inline constexpr std::size_t kMaximumCallsPerPeer = 256;
inline constexpr std::size_t kMaximumCallBytesPerPeer = std::size_t{256} << 10U;
// All unconfined processes are counted as one peer. They are trusted, and there may be hundreds of them at work.
inline constexpr std::size_t kMaximumUnconfinedConnections = 1024;
inline constexpr std::size_t kMaximumUnconfinedCalls = 4096;
inline constexpr std::size_t kMaximumUnconfinedCallBytes = std::size_t{4} << 20U;
// So are all that have no identity. Anybody may become one of these, and all that they may do is wake the daemon.
inline constexpr std::size_t kMaximumConnectionsOfNobody = 16;
inline constexpr std::size_t kMaximumCallsOfNobody = 16;
// Of a peer that is not trusted: sent over any of its connections, ended ones too, and not taken.
inline constexpr std::size_t kMaximumUntakenDescriptors = 128;

class ConnectionLimiter : public std::enable_shared_from_this<ConnectionLimiter> {
 public:
  enum class Verdict {
    admitted,
    refused,       // the first refusal since the peer was below its limit: worth a log line
    refusedAgain,  // another one
  };

  // One connection's place; dropping it gives the place back.
  class Place {
   public:
    Place(std::shared_ptr<ConnectionLimiter> limiter, std::string peer) : limiter_(std::move(limiter)), peer_(std::move(peer)) {}
    Place(const Place&) = delete;
    Place& operator=(const Place&) = delete;
    ~Place() { limiter_->giveBack(peer_); }

   private:
    const std::shared_ptr<ConnectionLimiter> limiter_;
    const std::string peer_;
  };

  struct Admission {
    Verdict verdict;
    // When admitted.
    std::unique_ptr<Place> place;
    std::shared_ptr<CallBudget> budget;           // the peer's
    std::shared_ptr<Reactor::Lane> lane;          // the peer's
    std::shared_ptr<UntakenDescriptors> untaken;  // the peer's
  };
  struct Limits {
    std::size_t connections;
    CallLimits calls;  // requests without an answer
  };
  // `peer` is what connections and requests are counted by; its limits are always the same.
  [[nodiscard]] Admission admit(const std::string& peer, Limits limits);

  // Of all peers together.
  [[nodiscard]] std::size_t openConnections() const;

 private:
  struct Count {
    std::shared_ptr<CallBudget> budget;
    std::shared_ptr<Reactor::Lane> lane;
    std::shared_ptr<UntakenDescriptors> untaken;
    std::size_t open = 0;
    bool refusing = false;

    [[nodiscard]] bool isForgettable() const {
      return open == 0 && budget.use_count() == 1 && lane.use_count() == 1 && untaken.use_count() == 1 && untaken->isEmpty();
    }
  };
  void giveBack(const std::string& peer);

  mutable std::mutex mutex_;
  std::map<std::string, Count> counts_;  // of peers with open connections, or with work that outlived theirs
};

}  // namespace docuvend::linux_platform
