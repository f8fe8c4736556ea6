// What is owed by a notice that is under way counts in no backlog: each application's share of that is no greater than the number of
// notices that all applications together have under way.

#include "platform/linux/coordination/ChangeNotices.h"

#include <algorithm>
#include <utility>

namespace docuvend::linux_platform {
namespace {

std::size_t bytesOf(const KeyedFile& file) { return file.url.absoluteString().size(); }

// The last one's URL is the one by which the file can be found: its directory may have been renamed.
void merge(FileChange& into, const FileChange& later) {
  into.file.url = later.file.url;
  for (const auto& [application, process] : later.writers) into.writers.insert_or_assign(application, process);
}

}  // namespace

bool ChangeNotices::hasRoomFor(const Owner& owner, const Application& application, const KeyedFile& file) const {
  const auto backlog = backlogs_.find({owner, application});
  if (backlog == backlogs_.end()) return true;
  const auto waiting = waiting_.find({owner, file.key});
  if (waiting != waiting_.end() && waiting->second.writers.contains(application)) return true;
  const auto& [files, bytes] = backlog->second;
  return files < (application ? kMaximumUntoldFiles : kMaximumUnconfinedUntoldFiles) &&
         bytes + bytesOf(file) <= (application ? kMaximumUntoldBytes : kMaximumUnconfinedUntoldBytes);
}

std::optional<ChangeNotices::Notice> ChangeNotices::add(const Owner& owner, const FileChange& change) {
  const auto running = underWay_.find({owner, change.file.key});
  if (running != underWay_.end()) {
    std::optional<FileChange>& owed = running->second.owed;
    if (!owed) owed = FileChange{change.file, /*writers=*/{}};
    merge(*owed, change);
    return std::nullopt;
  }
  wait(owner, change);
  const auto* provider = std::get_if<Provider>(&owner);
  if (provider == nullptr) return std::nullopt;
  for (const auto& writer : change.writers) {
    // Only a line that was empty gives what has come last.
    if (auto notice = begin(*provider, writer.first)) return notice;
  }
  return std::nullopt;
}

std::vector<ChangeNotices::Notice> ChangeNotices::end(const Provider& provider, const FileKey& file) {
  const auto ended = underWay_.extract({provider, file});
  if (ended.empty()) return {};
  const auto& [application, owed] = ended.mapped();
  lines_.end(provider, application);
  std::vector<Notice> notices;
  if (auto next = begin(provider, application)) notices.push_back(std::move(*next));
  if (owed) {
    if (auto again = add(provider, *owed)) notices.push_back(std::move(*again));
  }
  return notices;
}

std::vector<ChangeNotices::Untold> ChangeNotices::untoldOfAllBut(const std::vector<Provider>& providers) const {
  const auto isOther = [&providers](const Owner& owner) {
    const auto* provider = std::get_if<Provider>(&owner);
    return provider == nullptr || std::find(providers.begin(), providers.end(), *provider) == providers.end();
  };
  std::vector<Untold> untold;
  for (const auto& [place, notice] : underWay_) {
    if (notice.owed && isOther(place.first)) untold.push_back({place.first, notice.owed->file});
  }
  for (const auto& [place, change] : waiting_) {
    if (isOther(place.first)) untold.push_back({place.first, change.file});
  }
  return untold;
}

std::optional<ChangeNotices::Notice> ChangeNotices::move(const Untold& untold, const std::optional<Owner>& owner) {
  if (owner == untold.owner) return std::nullopt;
  const Place place{untold.owner, untold.file.key};
  std::optional<FileChange> change;
  if (const auto waiting = waiting_.find(place); waiting != waiting_.end()) {
    change = waitNoMore(waiting);
  } else if (const auto running = underWay_.find(place); running != underWay_.end()) {
    change = std::exchange(running->second.owed, std::nullopt);
  }
  if (!change || !owner) return std::nullopt;
  return add(*owner, *change);
}

void ChangeNotices::wait(const Owner& owner, const FileChange& change) {
  FileChange& waiting = waiting_.try_emplace({owner, change.file.key}, FileChange{change.file, /*writers=*/{}}).first->second;
  count(owner, waiting, Counting::out);
  merge(waiting, change);
  count(owner, waiting, Counting::in);
  const auto* provider = std::get_if<Provider>(&owner);
  if (provider == nullptr) return;
  for (const auto& writer : change.writers) lines_.enter(*provider, writer.first, change.file.key);
}

void ChangeNotices::count(const Owner& owner, const FileChange& change, Counting way) {
  const std::size_t bytes = bytesOf(change.file);
  for (const auto& writer : change.writers) {
    const auto found = backlogs_.try_emplace({owner, writer.first}).first;
    Backlog& backlog = found->second;
    if (way == Counting::in) {
      ++backlog.files;
      backlog.bytes += bytes;
    } else {
      backlog.bytes -= bytes;
      if (--backlog.files == 0) backlogs_.erase(found);
    }
  }
}

FileChange ChangeNotices::waitNoMore(std::map<Place, FileChange>::iterator waiting) {
  const Owner owner = waiting->first.first;
  FileChange change = std::move(waiting->second);
  waiting_.erase(waiting);
  count(owner, change, Counting::out);
  if (const auto* provider = std::get_if<Provider>(&owner)) lines_.leaveAll(*provider, change.file.key);
  return change;
}

std::optional<ChangeNotices::Notice> ChangeNotices::begin(const Provider& provider, const Application& application) {
  const auto file = lines_.begin(provider, application);
  if (!file) return std::nullopt;
  FileChange change = waitNoMore(waiting_.find({provider, *file}));
  underWay_.emplace(Place{provider, *file}, UnderWay{application, /*owed=*/{}});
  return Notice{provider, std::move(change.file), AccessHolder{change.writers.at(application), application}};
}

}  // namespace docuvend::linux_platform
