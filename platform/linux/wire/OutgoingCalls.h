// The messages that this end has sent and that may still be answered. Not guarded: the owner does that. Handlers are handed out and never
// destroyed here, for their end may run code of theirs.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <utility>
#include <vector>

#include "platform/rpc.h"

namespace docuvend::linux_platform {

// How far a message came that failed.
enum class MessageFate {
  refused,     // this end would not send it, or the peer would not run it; the connection goes on
  unsent,      // the connection ended before it had left whole, or before the peer had taken the connection: the peer has not run it
  unanswered,  // the connection ended after it had left: the peer may have run it
};
using FailureHandler = std::function<void(const QXError&, MessageFate)>;

class OutgoingCalls {
 public:
  struct Call {
    std::vector<QXValueKind> replies;
    QXRpcReply reply;  // empty: none wanted
    std::shared_ptr<const FailureHandler> failureHandler;
  };
  struct Lost {
    Call call;
    MessageFate fate;
  };
  using Forgotten = std::vector<Call>;  // to be destroyed where nothing is locked

  [[nodiscard]] bool isFull() const;
  // True while a call that wants a reply has none.
  [[nodiscard]] bool awaitsReplies() const { return !waiting_.empty(); }
  [[nodiscard]] std::uint64_t nextID() const { return nextID_; }
  // Takes `nextID` for the call.
  void add(Call call, Forgotten& forgotten);

  // True when an answer with that number can be one to a message of ours.
  [[nodiscard]] bool wasIssued(std::uint64_t callID) const { return callID > 0 && callID < nextID_; }
  // The call, which is then settled; none when it is settled already. The peer takes requests in order and refuses at once, so the
  // calls before this one that want no reply have been taken.
  [[nodiscard]] std::optional<Call> settle(std::uint64_t callID, Forgotten& forgotten);
  // What fails when the connection ends: the calls that want a reply, and those in `unwritten`. In the order of sending.
  [[nodiscard]] std::vector<Lost> settleAll(const std::vector<std::uint64_t>& unwritten, Forgotten& forgotten);

 private:
  void forgetUnconfirmedBefore(std::map<std::uint64_t, Call>::iterator end, Forgotten& forgotten);

  std::uint64_t nextID_ = 1;
  std::map<std::uint64_t, Call> waiting_;
  std::map<std::uint64_t, Call> unconfirmed_;  // want no reply; may still be refused
};

}  // namespace docuvend::linux_platform
