#include "platform/linux/coordination/LinuxFileCoordinator.h"

#include <algorithm>
#include <string>
#include <utility>
#include <variant>

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

void LinuxFileCoordinator::registrationsChanged() {
  ++registrationChanges_;
  tellUntold();
  std::function<void()> handler;
  {
    const std::lock_guard lock(mutex_);
    handler = registrationHandler_;
  }
  if (handler) handler();
}

void LinuxFileCoordinator::tellUntold() {
  std::map<FileKey, Untold> untold;
  {
    const std::lock_guard lock(mutex_);
    untold.swap(untold_);
  }
  for (const auto& [key, written] : untold) {
    tellFinishedWriting(ownerOf(written.file, DirectoryItself::counts), written.writerProcess, written.file, /*told=*/{});
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
  owner.registrationChanges = registrationChanges_;
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
    owner.failure = std::move(failure);
    return owner;
  }
  // Looked at last: the way to the file may have been changed into a way to somebody's file.
  if (outside_.isInPlace && !outside_.isInPlace(file)) return {};
  return owner;
}

QXCoordinationID LinuxFileCoordinator::nameFor(const char* role, int process) {
  std::string name(role);
  name.append(" ").append(std::to_string(process)).append("-").append(std::to_string(++names_));
  return {std::move(name)};
}

void LinuxFileCoordinator::askToProvide(const std::shared_ptr<QXDocuvend>& provider, int readerProcess, const QXURL& file,
                                        QXDocuvend::ProvideCompletion completion) {
  onItsQueue(*provider, [provider, reader = nameFor("reader", readerProcess), file, completion = std::move(completion)] {
    provider->_provideItemAtURL(file, reader, completion);
  });
}

void LinuxFileCoordinator::tellFinishedWriting(const FileOwner& owner, int writerProcess, const KeyedFile& file,
                                               std::function<void()> told) {
  if (owner.provider) {
    tell(owner.provider, writerProcess, file.url, std::move(told));
    return;
  }
  if (owner.awaited) {
    remember({writerProcess, file});
    if (hasChangedSince(owner)) tellUntold();
  }
  if (told) told();
}

void LinuxFileCoordinator::tell(const std::shared_ptr<QXDocuvend>& provider, int writerProcess, const QXURL& file,
                                std::function<void()> told) {
  onItsQueue(*provider, [provider, writer = nameFor("writer", writerProcess), file, told = std::move(told)] {
    provider->_writerWithID(writer, file);
    if (told) told();
  });
}

void LinuxFileCoordinator::remember(Untold untold) {
  const std::lock_guard lock(mutex_);
  if (untold_.size() >= kMaximumUntold && !untold_.contains(untold.file.key)) return;
  const FileKey key = untold.file.key;
  untold_.insert_or_assign(key, std::move(untold));
}

}  // namespace docuvend::linux_platform
