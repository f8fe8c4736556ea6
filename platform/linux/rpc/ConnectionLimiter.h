// How many connections one peer may hold open. May be used from any thread.
#pragma once

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>

namespace docuvend::linux_platform {

inline constexpr std::size_t kMaximumConnectionsPerPeer = 64;
// All unconfined processes are counted as one peer. They are trusted, and there may be hundreds of them at work.
inline constexpr std::size_t kMaximumUnconfinedConnections = 1024;

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
    std::unique_ptr<Place> place;  // when admitted
  };
  // `peer` is what connections are counted by; a peer has one limit.
  [[nodiscard]] Admission admit(const std::string& peer, std::size_t limit);

  // Of all peers together.
  [[nodiscard]] std::size_t openConnections() const;

 private:
  struct Count {
    std::size_t open = 0;
    bool refusing = false;
  };
  void giveBack(const std::string& peer);

  mutable std::mutex mutex_;
  std::map<std::string, Count> counts_;  // of peers with open connections
};

}  // namespace docuvend::linux_platform
