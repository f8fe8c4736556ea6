#include "platform/linux/coordination/LinuxFileCoordinator.h"

#include <algorithm>
#include <string>
#include <variant>

namespace docuvend::linux_platform {

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

std::shared_ptr<QXDocuvend> LinuxFileCoordinator::providerOf(const QXURL& file) const {
  for (const auto& provider : providers()) {
    const auto directory = provider->_providedItemsURL();
    if (!directory) continue;
    const auto answer = fileSystem_.relationship(*directory, file);
    const auto* relationship = std::get_if<QXRelationship>(&answer);
    if (relationship != nullptr && *relationship != QXRelationship::other) return provider;
  }
  return nullptr;
}

void LinuxFileCoordinator::tellFinishedWriting(const std::shared_ptr<QXDocuvend>& provider, int writerProcess, const QXURL& file,
                                               std::function<void()> told) {
  const QXCoordinationID writer{"writer " + std::to_string(writerProcess) + "-" + std::to_string(++writers_)};
  auto tell = [provider, writer, file, told = std::move(told)] {
    provider->_writerWithID(writer, file);
    if (told) told();
  };
  if (const auto queue = provider->_providedItemsOperationQueue()) {
    queue->addOperation(std::move(tell));
  } else {
    tell();
  }
}

}  // namespace docuvend::linux_platform
