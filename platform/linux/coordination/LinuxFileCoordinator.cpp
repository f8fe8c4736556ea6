#include "platform/linux/coordination/LinuxFileCoordinator.h"

#include <algorithm>
#include <string>
#include <utility>
#include <variant>

#include "platform/linux/base/LogSubject.h"
#include "platform/linux/base/Shortage.h"
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

bool isWantOfMeans(const QXError& error) { return error.domain == kQXSystemErrorDomain && isShortage(static_cast<int>(error.code)); }

LogSubject::Name subjectOf(const AccessHolder& holder) {
  return holder.bundleIdentifier ? std::make_shared<const std::string>(*holder.bundleIdentifier) : nullptr;
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

std::optional<ChangeNotices::Owner> FileOwner::known() const {
  if (provider) return provider;
  if (awaited) return *awaited;
  return std::nullopt;
}

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

// What is untold is at every moment noted at the owner that it had or at the one that it has now, so that it is counted and not lost. An
// owner may be gone when it is noted there: then it is all looked at again.
void LinuxFileCoordinator::tellUntold() {
  for (bool isOutdated = true; isOutdated;) {
    isOutdated = false;
    const auto registered = providers();
    std::vector<ChangeNotices::Untold> all;
    {
      const std::lock_guard lock(mutex_);
      all = notices_.untoldOfAllBut(registered);
    }
    for (const ChangeNotices::Untold& untold : all) {
      const FileOwner owner = ownerOf(untold.file, DirectoryItself::counts);
      std::optional<ChangeNotices::Notice> notice;
      {
        const std::lock_guard lock(mutex_);
        notice = notices_.move(untold, owner.known());
      }
      if (notice) begin(*notice, /*told=*/{});
      isOutdated = isOutdated || (!notice && owner.known() && hasChangedSince(owner));
    }
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
    if (error->url == file || isWantOfMeans(*error)) failure = *error;
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
  if (outside_.isInPlace && !outside_.isInPlace(file)) {
    FileOwner nobody;
    nobody.isLost = true;
    return nobody;
  }
  return owner;
}

std::string LinuxFileCoordinator::nameFor(const char* role, int process) {
  std::string name(role);
  name.append(" ").append(std::to_string(process)).append("-").append(std::to_string(++names_));
  return name;
}

void LinuxFileCoordinator::askToProvide(const std::shared_ptr<QXDocuvend>& provider, const AccessHolder& reader, const QXURL& file,
                                        QXDocuvend::ProvideCompletion completion) {
  const LogSubject subject(subjectOf(reader));
  onItsQueue(*provider, [provider, name = QXCoordinationID{nameFor("reader", reader.processIdentifier)}, file,
                         completion = std::move(completion)] { provider->_provideItemAtURL(file, name, completion); });
}

std::optional<QXError> LinuxFileCoordinator::refusalOfWrite(const FileOwner& owner, const AccessHolder& writer,
                                                            const KeyedFile& file) const {
  const auto known = owner.known();
  if (!known) return std::nullopt;
  const std::lock_guard lock(mutex_);
  if (notices_.hasRoomFor(*known, writer.bundleIdentifier, file)) return std::nullopt;
  return makeCoordinationError(FileCoordinationErrorCode::tooManyChanges,
                               "the provider has not been told yet of too much that the caller has written", file.url);
}

void LinuxFileCoordinator::tellFinishedWriting(const FileOwner& owner, const AccessHolder& writer, const KeyedFile& file,
                                               std::function<void()> told) {
  std::optional<ChangeNotices::Notice> notice;
  const auto known = owner.known();
  if (known) {
    const std::lock_guard lock(mutex_);
    notice = notices_.add(*known, {file, {{writer.bundleIdentifier, writer.processIdentifier}}});
  }
  if (notice) {
    begin(*notice, std::move(told));
    return;
  }
  if (known && hasChangedSince(owner)) tellUntold();
  const LogSubject subject(subjectOf(writer));
  if (owner.isLost) {
    logError(qxLogMessage("[ERROR] Nobody can be told that the item at URL %@ has changed: it is not where it was.", file.url));
  } else if (owner.failure) {
    logError(qxLogMessage("[ERROR] Nobody can be told that the item at URL %@ has changed. Error: %@", file.url, *owner.failure));
  }
  if (told) told();
}

void LinuxFileCoordinator::begin(const ChangeNotices::Notice& notice, std::function<void()> told) {
  const auto& [provider, file, writer] = notice;
  const LogSubject subject(subjectOf(writer));
  auto untilTold = std::make_shared<const NoticeUnderWay>(*this, provider, file.key);
  onItsQueue(*provider, [provider = provider, name = nameFor("writer", writer.processIdentifier), untilTold = std::move(untilTold),
                         url = file.url, told = std::move(told)]() mutable {
    provider->_writerWithID({std::move(name), std::move(untilTold)}, url);
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

void LinuxFileCoordinator::logError(const QXLogMessage& message) const {
  if (outside_.log != nullptr) qxLog(*outside_.log, message);
}

}  // namespace docuvend::linux_platform
