#include "platform/linux/coordination/LinuxFileCoordinator.h"

#include <algorithm>
#include <string>
#include <utility>
#include <variant>

#include "platform/linux/coordination/CoordinationErrors.h"

namespace docuvend::linux_platform {
namespace {

void onItsQueue(const QXDocuvend& provider, QXTask task) {
  if (const auto queue = provider._providedItemsOperationQueue()) {
    queue->addOperation(std::move(task));
  } else {
    task();
  }
}

}  // namespace

// Whoever drops the last reference ends it, and never while the coordinator has its lock.
class LinuxFileCoordinator::NoticeUnderWay {
 public:
  NoticeUnderWay(LinuxFileCoordinator& coordinator, std::shared_ptr<QXDocuvend> provider, FileKey file)
      : coordinator_(coordinator), provider_(std::move(provider)), file_(std::move(file)) {}
  NoticeUnderWay(const NoticeUnderWay&) = delete;
  NoticeUnderWay& operator=(const NoticeUnderWay&) = delete;
  ~NoticeUnderWay() { coordinator_.noticeHasEnded(provider_, file_); }

 private:
  LinuxFileCoordinator& coordinator_;
  const std::shared_ptr<QXDocuvend> provider_;
  const FileKey file_;
};

void LinuxFileCoordinator::_addDocuvend(std::shared_ptr<QXDocuvend> provider) {
  if (!provider) return;
  {
    const std::lock_guard lock(mutex_);
    const auto found = std::find_if(registrations_.begin(), registrations_.end(),
                                    [&provider](const Registration& registration) { return registration.provider == provider; });
    if (found != registrations_.end()) {
      ++found->count;
    } else {
      registrations_.push_back({std::move(provider), 1});
    }
  }
  registrationsChanged();
}

void LinuxFileCoordinator::_removeDocuvend(const std::shared_ptr<QXDocuvend>& provider) {
  std::shared_ptr<QXDocuvend> last;  // goes when the lock is free: its end may call back
  {
    const std::lock_guard lock(mutex_);
    const auto found = std::find_if(registrations_.begin(), registrations_.end(),
                                    [&provider](const Registration& registration) { return registration.provider == provider; });
    if (found != registrations_.end()) {
      if (--found->count > 0) return;
      last = std::move(found->provider);
      registrations_.erase(found);
    }
  }
  // Also of one that never was added, because its setup failed: when its bundle is gone, nobody has it to wait for any more.
  registrationsChanged();
}

void LinuxFileCoordinator::setRegistrationHandler(std::function<void()> handler) {
  const std::lock_guard lock(mutex_);
  registrationHandler_ = std::move(handler);
}

void LinuxFileCoordinator::installedStoragesChanged() {
  ++changes_;
  callHandler();
}

void LinuxFileCoordinator::registrationsChanged() {
  ++changes_;
  tellUntold();
  callHandler();
}

void LinuxFileCoordinator::callHandler() {
  std::function<void()> handler;
  {
    const std::lock_guard lock(mutex_);
    handler = registrationHandler_;
  }
  if (handler) handler();
}

void LinuxFileCoordinator::tellUntold() {
  const auto registered = providers();
  std::map<FileKey, FileChange> untold;
  {
    const std::lock_guard lock(mutex_);
    for (FileChange& change : notices_.takeFromAllBut(registered)) untold_.insert_or_assign(change.file.key, std::move(change));
    untold.swap(untold_);
  }
  for (const auto& [key, change] : untold) {
    tellFinishedWriting(ownerOf(change.file, DirectoryItself::counts), change.writer, change.file, /*told=*/{});
  }
}

std::vector<std::shared_ptr<QXDocuvend>> LinuxFileCoordinator::providers() const {
  const std::lock_guard lock(mutex_);
  std::vector<std::shared_ptr<QXDocuvend>> list;
  list.reserve(registrations_.size());
  for (const Registration& registration : registrations_) list.push_back(registration.provider);
  return list;
}

bool LinuxFileCoordinator::contains(const QXURL& directory, const QXURL& file, DirectoryItself itself,
                                    std::optional<QXError>& failure) const {
  const auto answer = fileSystem_.relationship(directory, file);
  if (const auto* error = std::get_if<QXError>(&answer)) {
    // A directory that is not there, or is none, holds nothing: what a provider makes of its own must not concern others' files.
    if (error->url == file) failure = *error;
    return false;
  }
  const auto relationship = std::get<QXRelationship>(answer);
  return relationship == QXRelationship::contains || (relationship == QXRelationship::same && itself == DirectoryItself::counts);
}

FileOwner LinuxFileCoordinator::ownerOf(const KeyedFile& file, DirectoryItself itself) const {
  FileOwner owner;
  owner.changes = changes_;
  std::optional<QXError> failure;
  for (const auto& provider : providers()) {
    const auto directory = provider->_providedItemsURL();
    if (directory && contains(*directory, file.url, itself, failure)) {
      owner.provider = provider;
      break;
    }
  }
  if (!owner.provider && outside_.installedStorages) {
    for (const InstalledStorage& storage : outside_.installedStorages()) {
      if (!contains(storage.directory, file.url, itself, failure)) continue;
      owner.awaited = storage.bundleIdentifier;
      break;
    }
  }
  if (!owner.provider && !owner.awaited) {
    if (!failure && outside_.isRemnant && outside_.isRemnant(file)) {
      failure = makeCoordinationError(FileCoordinationErrorCode::noProvider,
                                      "the file's provider is not installed, and the contents are not here", file.url);
    }
    owner.failure = std::move(failure);
    return owner;
  }
  // Looked at last: the way to the file may have been changed into a way to somebody's file.
  if (outside_.isInPlace && !outside_.isInPlace(file)) return {};
  return owner;
}

std::string LinuxFileCoordinator::nameFor(const char* role, int process) {
  std::string name(role);
  name.append(" ").append(std::to_string(process)).append("-").append(std::to_string(++names_));
  return name;
}

void LinuxFileCoordinator::askToProvide(const std::shared_ptr<QXDocuvend>& provider, int readerProcess, const QXURL& file,
                                        QXDocuvend::ProvideCompletion completion) {
  onItsQueue(*provider, [provider, reader = QXCoordinationID{nameFor("reader", readerProcess)}, file, completion = std::move(completion)] {
    provider->_provideItemAtURL(file, reader, completion);
  });
}

void LinuxFileCoordinator::tellFinishedWriting(const FileOwner& owner, const AccessHolder& writer, const KeyedFile& file,
                                               std::function<void()> told) {
  const FileChange change{writer, file};
  bool beginsNow = false;
  {
    const std::lock_guard lock(mutex_);
    if (owner.provider) {
      beginsNow = notices_.add(owner.provider, change);
    } else if (owner.awaited) {
      untold_.insert_or_assign(file.key, change);
    }
  }
  if (beginsNow) {
    begin({owner.provider, change}, std::move(told));
    return;
  }
  if ((owner.provider || owner.awaited) && hasChangedSince(owner)) tellUntold();
  if (told) told();
}

void LinuxFileCoordinator::begin(const ChangeNotices::Notice& notice, std::function<void()> told) {
  const auto& [provider, change] = notice;
  auto untilTold = std::make_shared<const NoticeUnderWay>(*this, provider, change.file.key);
  onItsQueue(*provider, [provider = provider, name = nameFor("writer", change.writer.processIdentifier), untilTold = std::move(untilTold),
                         file = change.file.url, told = std::move(told)]() mutable {
    provider->_writerWithID({std::move(name), std::move(untilTold)}, file);
    if (told) told();
  });
}

void LinuxFileCoordinator::noticeHasEnded(const std::shared_ptr<QXDocuvend>& provider, const FileKey& file) {
  std::vector<ChangeNotices::Notice> next;
  {
    const std::lock_guard lock(mutex_);
    next = notices_.end(provider, file);
  }
  for (const ChangeNotices::Notice& notice : next) begin(notice, /*told=*/{});
}

}  // namespace docuvend::linux_platform
