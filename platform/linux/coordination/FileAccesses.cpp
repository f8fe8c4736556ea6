// How an access goes on
//
// Every change is made in two halves: with the lock held the table, the requests to providers and the entries are brought from one
// consistent state to the next, and what follows from that (answers, questions to providers) is collected; then the lock is given back and
// the collected is carried out. Providers are looked up without the lock as well, since that asks them and the file system: an access may
// therefore have ended by the time its provider is known, and is looked for again.
//
// An access is in the table exactly while it has an entry. A write that ends keeps both until the provider is being told, or sure to be.

#include "platform/linux/coordination/FileAccesses.h"

#include <algorithm>
#include <cassert>
#include <utility>

#include "platform/linux/coordination/CoordinationErrors.h"

namespace docuvend::linux_platform {
namespace {

QXError wouldDeadlock(const QXURL& url) {
  return makeCoordinationError(FileCoordinationErrorCode::wouldDeadlock,
                               "the wait would never end: those who are waited for wait for the caller themselves", url);
}

QXError endedBeforeItBegan(const QXURL& url) {
  return makeCoordinationError(FileCoordinationErrorCode::ended, "the access was ended before it had begun", url);
}

QXError tooManyAccesses(const QXURL& url) {
  return makeCoordinationError(FileCoordinationErrorCode::tooManyAccesses, "the application has as many accesses as it may have", url);
}

}  // namespace

FileAccesses::FileAccesses(LinuxFileCoordinator& coordinator) : coordinator_(coordinator) {
  // This outlives every registration.
  coordinator_.setRegistrationHandler([this] { lookAgain(); });
}

FileAccesses::~FileAccesses() { coordinator_.setRegistrationHandler({}); }

AccessNumber FileAccesses::newNumber() { return ++lastNumber_; }

void FileAccesses::begin(AccessNumber number, FileAccess access, Answer answer) {
  Consequences consequences;
  const Application application = access.holder.bundleIdentifier;
  auto directory = access.kind == AccessKind::writing ? HeldDirectory::of({access.file, access.url}) : std::nullopt;
  {
    const std::lock_guard lock(mutex_);
    assert(!entries_.contains(number));
    enter(number, {std::move(access), Stage::waiting, std::move(answer)}, consequences);
    if (directory && entries_.contains(number)) directories_.add(number, application, *std::move(directory));
  }
  carryOut(std::move(consequences));
}

void FileAccesses::enter(AccessNumber number, Entry entry, Consequences& consequences) {
  const FileAccess& access = entry.access;
  const Application application = access.holder.bundleIdentifier;
  if (!hasRoomFor(application)) return answerWith(entry, tooManyAccesses(access.url), consequences);
  const AccessTable::Entry entered = table_.enter(number, access.file, access.kind, access.party);
  if (entered == AccessTable::Entry::wouldDeadlock) return answerWith(entry, wouldDeadlock(access.url), consequences);
  entries_.emplace(number, std::move(entry));
  ++counts_[application];
  if (entered == AccessTable::Entry::hasTurn) takeTurn(number, consequences);
}

bool FileAccesses::hasRoomFor(const Application& application) const {
  const auto count = counts_.find(application);
  return count == counts_.end() || count->second < (application ? kMaximumAccessesOfApplication : kMaximumUnconfinedAccesses);
}

void FileAccesses::end(AccessNumber number, std::function<void()> ended) {
  std::optional<Written> written;
  Consequences consequences;
  {
    const std::lock_guard lock(mutex_);
    const auto found = entries_.find(number);
    if (found != entries_.end() && found->second.stage != Stage::ending) {
      Entry& entry = found->second;
      if (entry.stage == Stage::holding && entry.access.kind == AccessKind::writing) {
        entry.stage = Stage::ending;
        written = Written{entry.access, directories_.take(number)};
      } else {
        if (entry.stage != Stage::holding) answerWith(entry, endedBeforeItBegan(entry.access.url), consequences);
        remove(number, consequences);
      }
    }
    if (!written) consequences.answers.push_back(std::move(ended));
  }
  if (written) tellThenRelease(number, *written, std::move(ended));
  carryOut(std::move(consequences));
}

void FileAccesses::tellThenRelease(AccessNumber number, const Written& written, std::function<void()> ended) {
  const auto& [access, directory] = written;
  const KeyedFile before{access.file, access.url};
  KeyedFile file = directory ? directory->whereIsNow(before) : before;
  FileOwner owner = coordinator_.ownerOf(file, LinuxFileCoordinator::DirectoryItself::counts);
  // The room for a write was asked for where it began, at whoever was the owner there.
  if (file.url != before.url && coordinator_.refusalOfWrite(owner, access.holder, file)) {
    file = before;
    owner = coordinator_.ownerOf(file, LinuxFileCoordinator::DirectoryItself::counts);
  }
  // This outlives the telling.
  coordinator_.tellFinishedWriting(owner, access.holder, file, [this, number, ended = std::move(ended)] { release(number, ended); });
}

void FileAccesses::release(AccessNumber number, std::function<void()> ended) {
  Consequences consequences;
  {
    const std::lock_guard lock(mutex_);
    remove(number, consequences);
    consequences.answers.push_back(std::move(ended));
  }
  carryOut(std::move(consequences));
}

void FileAccesses::takeTurn(AccessNumber number, Consequences& consequences) {
  Entry& entry = entries_.at(number);
  const FileAccess& access = entry.access;
  if (access.kind == AccessKind::writing || provisions_.isProvided(access.file, access.party.process)) {
    hold(entry, consequences);
    return;
  }
  entry.stage = Stage::providing;
  consequences.readers.push_back(reader(number, entry));
}

void FileAccesses::hold(Entry& entry, Consequences& consequences) {
  entry.stage = Stage::holding;
  answerWith(entry, /*error=*/{}, consequences);
}

void FileAccesses::answerWith(Entry& entry, std::optional<QXError> error, Consequences& consequences) {
  consequences.answers.push_back([answer = std::move(entry.answer), error = std::move(error)] {
    if (answer) answer(error);
  });
}

void FileAccesses::remove(AccessNumber number, Consequences& consequences) {
  const auto found = entries_.find(number);
  const FileAccess access = std::move(found->second.access);
  entries_.erase(found);
  const auto count = counts_.find(access.holder.bundleIdentifier);
  if (--count->second == 0) counts_.erase(count);
  (void)directories_.take(number);
  provisions_.leave(number);
  awaiting_.erase(number);
  const std::vector<AccessNumber> come = table_.leave(number);
  if (!table_.hasTurn(access.party.process, access.file)) provisions_.noteTurnIsOver(access.file, access.party.process);
  for (const AccessNumber next : come) takeTurn(next, consequences);
}

void FileAccesses::carryOut(Consequences consequences) {
  for (const auto& answer : consequences.answers) {
    if (answer) answer();
  }
  for (const Reader& reader : consequences.readers) provide(reader);
  for (const Question& question : consequences.questions) ask(question);
}

void FileAccesses::provide(const Reader& reader) {
  const FileOwner owner = coordinator_.ownerOf({reader.file, reader.url}, LinuxFileCoordinator::DirectoryItself::doesNotCount);
  bool waitsForOwner = owner.awaited.has_value();
  Consequences consequences;
  {
    const std::lock_guard lock(mutex_);
    const auto found = entries_.find(reader.number);
    if (found == entries_.end()) return;
    if (owner.provider) {
      const auto joined = provisions_.join(owner.provider, reader.file, reader.number, reader.process, reader.holder.bundleIdentifier);
      waitsForOwner = joined.wait == Provisions::Wait::inLine;
      if (joined.wait == Provisions::Wait::forNewRequest) {
        consequences.questions.push_back(question(owner.provider, {joined.request, reader.number}));
      }
    } else if (owner.awaited) {
      awaiting_.insert(reader.number);
    } else if (owner.failure) {
      answerWith(found->second, owner.failure, consequences);
      remove(reader.number, consequences);
    } else {
      hold(found->second, consequences);
    }
  }
  carryOut(std::move(consequences));
  if (waitsForOwner && coordinator_.hasChangedSince(owner)) lookAgain();
}

FileAccesses::Question FileAccesses::question(const std::shared_ptr<QXDocuvend>& provider, const Provisions::Question& asked) const {
  const FileAccess& access = entries_.at(asked.number).access;
  return {provider, asked.request, access.holder, access.url};
}

void FileAccesses::ask(const Question& question) {
  // This outlives the request.
  coordinator_.askToProvide(question.provider, question.reader, question.url,
                            [this, request = question.request](const std::optional<QXError>& error) { requestIsAnswered(request, error); });
}

// Also for those who wait until they may ask: the object that they would ask may have been replaced.
void FileAccesses::lookAgain() {
  Consequences consequences;
  {
    const std::lock_guard lock(mutex_);
    std::set<AccessNumber> numbers = provisions_.leaveLines();
    numbers.merge(std::exchange(awaiting_, {}));
    for (const AccessNumber number : numbers) consequences.readers.push_back(reader(number, entries_.at(number)));
  }
  carryOut(std::move(consequences));
}

FileAccesses::Reader FileAccesses::reader(AccessNumber number, const Entry& entry) {
  const FileAccess& access = entry.access;
  return {number, access.file, access.url, access.holder, access.party.process};
}

void FileAccesses::requestIsAnswered(ProvideRequest request, const std::optional<QXError>& error) {
  std::optional<Provisions::Finished> finished;
  Consequences consequences;
  {
    const std::lock_guard lock(mutex_);
    finished = provisions_.finish(request);
    if (!finished) return;
    if (finished->next) consequences.questions.push_back(question(finished->provider, *finished->next));
    if (!error) {
      for (const QXAuditToken& process : finished->processes) {
        if (table_.hasTurn(process, finished->file)) provisions_.noteProvided(finished->file, process);
      }
    }
    for (const AccessNumber number : finished->waiting) {
      Entry& entry = entries_.at(number);
      if (error) {
        answerWith(entry, error, consequences);
        remove(number, consequences);
      } else {
        hold(entry, consequences);
      }
    }
  }
  carryOut(std::move(consequences));
}

std::vector<KnownAccess> FileAccesses::of(const FileKey& file, std::size_t most) const {
  const std::lock_guard lock(mutex_);
  std::vector<KnownAccess> known;
  for (const AccessTable::State& state : table_.of(file)) {
    if (known.size() == most) break;
    const Entry& entry = entries_.at(state.number);
    known.push_back({entry.access, stateOf(entry.stage)});
  }
  return known;
}

std::optional<AccessState> FileAccesses::stateOf(AccessNumber number) const {
  const std::lock_guard lock(mutex_);
  const auto found = entries_.find(number);
  if (found == entries_.end()) return std::nullopt;
  return stateOf(found->second.stage);
}

std::optional<KeyedFile> FileAccesses::beingProvided(AccessNumber number) const {
  const std::lock_guard lock(mutex_);
  const auto found = entries_.find(number);
  if (found == entries_.end() || found->second.stage != Stage::providing) return std::nullopt;
  return KeyedFile{found->second.access.file, found->second.access.url};
}

AccessState FileAccesses::stateOf(Stage stage) {
  switch (stage) {
    case Stage::waiting:
      return AccessState::waiting;
    case Stage::providing:
      return AccessState::providing;
    case Stage::holding:
    case Stage::ending:
      break;
  }
  return AccessState::holding;
}

bool FileAccesses::isWriting(const QXAuditToken& process, const FileKey& file) const {
  const std::lock_guard lock(mutex_);
  const auto states = table_.of(file);
  return std::any_of(states.begin(), states.end(), [this, &process](const AccessTable::State& state) {
    const Entry& entry = entries_.at(state.number);
    return entry.stage == Stage::holding && entry.access.kind == AccessKind::writing && entry.access.party.process == process;
  });
}

}  // namespace docuvend::linux_platform
