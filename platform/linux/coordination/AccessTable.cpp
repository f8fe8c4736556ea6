// How a file's line moves
//
// A file has a line: accesses that have the turn, and accesses that wait. Whoever waits at the head gets the turn when it excludes none of
// the other processes' accesses that have it; then the next one is looked at, and so on until one has to go on waiting. Nobody is ever
// passed over but by the further accesses of a process that has the turn: those begin without queueing, or, when they write within their
// own read, queue at the head.
//
// Turns that are got or given up only shorten waits. An access that is entered waits for others, and makes those wait for it that it goes
// before; one that begins at once is of a party that does not wait. So a cycle can only be closed by the access that is just being entered
// and waits, it leads through that access, and looking from there finds it.

#include "platform/linux/coordination/AccessTable.h"

#include <algorithm>
#include <optional>
#include <utility>

namespace docuvend::linux_platform {

bool AccessTable::Access::excludes(const Access& other) const {
  return party.process != other.party.process && (kind == AccessKind::writing || other.kind == AccessKind::writing);
}

bool AccessTable::Line::has(const QXAuditToken& process) const {
  return std::any_of(having.begin(), having.end(), [&process](const Access& access) { return access.party.process == process; });
}

bool AccessTable::Line::hasRoomFor(const Access& access) const {
  return std::none_of(having.begin(), having.end(), [&access](const Access& other) { return other.excludes(access); });
}

// Whether the wait of an access that has just taken its place in a line leads back to its party. Nobody in a line passes another, so who
// waits for one place in it waits for all before; a line is therefore gone through once from there to its head, and not again for a place
// that has been passed.
class AccessTable::Cycle {
 public:
  Cycle(const AccessTable& table, const AccessParty& party) : table_(table), party_(party) {}

  [[nodiscard]] bool isClosedBy(AccessNumber number) {
    await(number);
    while (!isClosed_ && !open_.empty()) {
      const AccessNumber next = open_.back();
      open_.pop_back();
      if (!passed_.contains(next)) goThrough(table_.lines_.at(table_.places_.at(next).file), next);
    }
    return isClosed_;
  }

 private:
  // The processes of accesses, as far as it matters whether one of them is another than a given one.
  class Processes {
   public:
    void add(const QXAuditToken& process) {
      hasSeveral_ = hasSeveral_ || (one_ && *one_ != process);
      one_ = process;
    }
    [[nodiscard]] bool haveAnotherThan(const QXAuditToken& process) const { return hasSeveral_ || (one_ && *one_ != process); }

   private:
    std::optional<QXAuditToken> one_;
    bool hasSeveral_ = false;
  };

  // An access that waits has to get its turn.
  void await(AccessNumber number) { open_.push_back(number); }

  // A party has to go on.
  void await(const AccessParty& party) {
    if (party == party_) isClosed_ = true;
    if (!awaitedParties_.insert(party).second) return;
    for (const AccessNumber number : table_.parties_.at(party).waiting) await(number);
  }

  void goThrough(const Line& line, AccessNumber number) {
    // Of those that wait from the one that is looked at to the one with the number.
    Processes all;
    Processes writing;
    const auto awaitIfExcluded = [this, &all, &writing](const Access& access) {
      const Processes& excluded = access.kind == AccessKind::writing ? all : writing;
      if (excluded.haveAnotherThan(access.party.process)) await(access.party);
    };
    auto place =
        std::find_if(line.waiting.rbegin(), line.waiting.rend(), [number](const Access& access) { return access.number == number; });
    for (; place != line.waiting.rend(); ++place) {
      awaitIfExcluded(*place);
      passed_.insert(place->number);
      all.add(place->party.process);
      if (place->kind == AccessKind::writing) writing.add(place->party.process);
    }
    std::for_each(line.having.begin(), line.having.end(), awaitIfExcluded);
  }

  const AccessTable& table_;
  const AccessParty& party_;
  bool isClosed_ = false;
  std::vector<AccessNumber> open_;
  std::set<AccessNumber> passed_;
  std::set<AccessParty> awaitedParties_;
};

AccessTable::Entry AccessTable::enter(AccessNumber number, const FileKey& file, AccessKind kind, const AccessParty& party) {
  Line& line = lines_[file];
  const Access access{number, kind, party};
  const bool isWithin = line.has(party.process);
  const bool goesAtOnce = line.hasRoomFor(access) && (isWithin || line.waiting.empty());
  const bool wasEngaged = parties_.contains(party);
  Engagement& engagement = parties_[party];
  places_.emplace(number, Place{file, party});
  if (goesAtOnce) {
    line.having.push_back(access);
    engagement.having.insert(number);
    return Entry::hasTurn;
  }
  line.waiting.insert(isWithin ? line.waiting.begin() : line.waiting.end(), access);
  engagement.waiting.insert(number);
  // Nobody waits for a party that has nothing else, unless it goes before others.
  if ((wasEngaged || isWithin) && Cycle(*this, party).isClosedBy(number)) {
    std::erase_if(line.waiting, [number](const Access& waiting) { return waiting.number == number; });
    forget(number);
    return Entry::wouldDeadlock;
  }
  return Entry::waits;
}

void AccessTable::forget(AccessNumber number) {
  const auto place = places_.find(number);
  const auto engagement = parties_.find(place->second.party);
  engagement->second.having.erase(number);
  engagement->second.waiting.erase(number);
  if (engagement->second.having.empty() && engagement->second.waiting.empty()) parties_.erase(engagement);
  places_.erase(place);
}

std::vector<AccessNumber> AccessTable::leave(AccessNumber number) {
  const auto place = places_.find(number);
  if (place == places_.end()) return {};
  const auto at = lines_.find(place->second.file);
  Line& line = at->second;
  const auto isIt = [number](const Access& access) { return access.number == number; };
  std::erase_if(line.having, isIt);
  std::erase_if(line.waiting, isIt);
  forget(number);
  std::vector<AccessNumber> come;
  auto head = line.waiting.begin();
  for (; head != line.waiting.end() && line.hasRoomFor(*head); ++head) {
    line.having.push_back(*head);
    Engagement& engagement = parties_.at(head->party);
    engagement.waiting.erase(head->number);
    engagement.having.insert(head->number);
    come.push_back(head->number);
  }
  line.waiting.erase(line.waiting.begin(), head);
  if (line.having.empty() && line.waiting.empty()) lines_.erase(at);
  return come;
}

std::vector<AccessTable::State> AccessTable::of(const FileKey& file) const {
  std::vector<State> states;
  const auto at = lines_.find(file);
  if (at == lines_.end()) return states;
  for (const Access& access : at->second.having) states.push_back({access.number, /*hasTurn=*/true});
  for (const Access& access : at->second.waiting) states.push_back({access.number, /*hasTurn=*/false});
  return states;
}

bool AccessTable::hasTurn(const QXAuditToken& process, const FileKey& file) const {
  const auto at = lines_.find(file);
  return at != lines_.end() && at->second.has(process);
}

bool AccessTable::isWriting(const QXAuditToken& process, const FileKey& file) const {
  const auto at = lines_.find(file);
  return at != lines_.end() && std::any_of(at->second.having.begin(), at->second.having.end(), [&process](const Access& access) {
           return access.kind == AccessKind::writing && access.party.process == process;
         });
}

bool AccessTable::isEmpty() const { return lines_.empty(); }

}  // namespace docuvend::linux_platform
