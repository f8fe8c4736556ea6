// Who has the turn at which file: many readers or one writer, in the order in which they came.
//
// A pure value: no clock, no thread, no file. What has a turn is a process: its further accesses to a file of which it has the turn do not
// queue. Reading then begins at once, and so does writing within its own write; writing within its own read goes before all who queue and
// waits for the other readers. Everybody else waits behind those who came before.
//
// A cycle is looked for between parties, each of which does one thing after another. An access that waits is held up by those accesses of
// other processes that have the turn and exclude it, and by those that queue before it: all of them have to get their turn, and those that
// exclude it have to end as well. One ends only when its party goes on, which it cannot while an access of that party waits. An access
// whose wait would lead back to its own party this way is not entered.
#pragma once

#include <compare>
#include <cstdint>
#include <map>
#include <set>
#include <vector>

#include "platform/linux/coordination/FileKey.h"
#include "platform/rpc.h"

namespace docuvend::linux_platform {

enum class AccessKind { reading, writing };

struct AccessParty {
  QXAuditToken process;
  std::int64_t number = 0;  // of the process
  friend auto operator<=>(const AccessParty&, const AccessParty&) = default;
};

// Chosen by whoever enters an access; never used twice.
using AccessNumber = std::uint64_t;

class AccessTable {
 public:
  enum class Entry { hasTurn, waits, wouldDeadlock };
  // wouldDeadlock: it is not entered.
  [[nodiscard]] Entry enter(AccessNumber number, const FileKey& file, AccessKind kind, const AccessParty& party);
  // An access ends, whether it had its turn or waited; one that is not there is ignored. Those whose turn has come by that, in order.
  [[nodiscard]] std::vector<AccessNumber> leave(AccessNumber number);

  struct State {
    AccessNumber number;
    bool hasTurn;
    friend bool operator==(const State&, const State&) = default;
  };
  // Those that have the turn in the order in which they got it, then those that wait in the order in which they will.
  [[nodiscard]] std::vector<State> of(const FileKey& file) const;
  [[nodiscard]] bool hasTurn(const QXAuditToken& process, const FileKey& file) const;
  [[nodiscard]] bool isWriting(const QXAuditToken& process, const FileKey& file) const;
  [[nodiscard]] bool isEmpty() const;

 private:
  class Cycle;
  struct Access {
    AccessNumber number;
    AccessKind kind;
    AccessParty party;
    [[nodiscard]] bool excludes(const Access& other) const;
  };
  struct Line {
    std::vector<Access> having;   // in the order in which they got the turn
    std::vector<Access> waiting;  // in the order in which they will get it
    [[nodiscard]] bool has(const QXAuditToken& process) const;
    [[nodiscard]] bool hasRoomFor(const Access& access) const;
  };
  struct Place {
    FileKey file;
    AccessParty party;
  };
  // Numbers of a party's accesses.
  struct Engagement {
    std::set<AccessNumber> having;
    std::set<AccessNumber> waiting;
  };
  void forget(AccessNumber number);

  // Lines with nobody and parties with nothing are not kept.
  std::map<FileKey, Line> lines_;
  std::map<AccessNumber, Place> places_;
  std::map<AccessParty, Engagement> parties_;
};

}  // namespace docuvend::linux_platform
