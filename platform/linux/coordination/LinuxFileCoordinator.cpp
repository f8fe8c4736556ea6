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
  const std::lock_guard lock(mutex_);
  const auto found = std::find_if(registrations_.begin(), registrations_.end(),
                                  [&provider](const Registration& registration) { return registration.provider == provider; });
  if (found != registrations_.end()) {
    ++found->count;
  } else {
    registrations_.push_back({std::move(provider), 1});
  }
}

void LinuxFileCoordinator::_removeDocuvend(const std::shared_ptr<QXDocuvend>& provider) {
  std::shared_ptr<QXDocuvend> last;  // goes when the lock is free: its end may call back
  const std::lock_guard lock(mutex_);
  const auto found = std::find_if(registrations_.begin(), registrations_.end(),
                                  [&provider](const Registration& registration) { return registration.provider == provider; });
  if (found == registrations_.end() || --found->count > 0) return;
  last = std::move(found->provider);
  registrations_.erase(found);
}

std::vector<std::shared_ptr<QXDocuvend>> LinuxFileCoordinator::providers() const {
  const std::lock_guard lock(mutex_);
  std::vector<std::shared_ptr<QXDocuvend>> list;
  list.reserve(registrations_.size());
  for (const Registration& registration : registrations_) list.push_back(registration.provider);
  return list;
}

std::shared_ptr<QXDocuvend> LinuxFileCoordinator::providerOf(const QXURL& file, DirectoryItself itself) const {
  for (const auto& provider : providers()) {
    const auto directory = provider->_providedItemsURL();
    if (!directory) continue;
    const auto answer = fileSystem_.relationship(*directory, file);
    const auto* relationship = std::get_if<QXRelationship>(&answer);
    if (relationship == nullptr || *relationship == QXRelationship::other) continue;
    if (*relationship == QXRelationship::contains || itself == DirectoryItself::counts) return provider;
  }
  return nullptr;
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

void LinuxFileCoordinator::tellFinishedWriting(const std::shared_ptr<QXDocuvend>& provider, int writerProcess, const QXURL& file,
                                               std::function<void()> told) {
  onItsQueue(*provider, [provider, writer = nameFor("writer", writerProcess), file, told = std::move(told)] {
    provider->_writerWithID(writer, file);
    if (told) told();
  });
}

}  // namespace docuvend::linux_platform
