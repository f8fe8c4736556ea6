#include "platform/linux/sandbox/RedemptionLedger.h"

#include <algorithm>

namespace docuvend::linux_platform {

void RedemptionLedger::enter(const std::string& instance, const ObjectIdentity& object) {
  if (instance.empty()) return;
  const std::lock_guard lock(mutex_);
  const auto found = std::find_if(entries_.begin(), entries_.end(), [&](const Entry& entry) { return entry.instance == instance; });
  if (found == entries_.end()) {
    if (entries_.size() == kMaximumInstances) entries_.erase(entries_.begin());
    entries_.push_back({instance, {}});
  } else {
    std::rotate(found, found + 1, entries_.end());
  }
  auto& objects = entries_.back().objects;
  objects.erase(std::remove(objects.begin(), objects.end(), object), objects.end());
  if (objects.size() == kMaximumObjectsPerInstance) objects.pop_front();
  objects.push_back(object);
}

void RedemptionLedger::forgetAll() {
  const std::lock_guard lock(mutex_);
  entries_.clear();
}

bool RedemptionLedger::holds(const std::string& instance, const ObjectIdentity& object) const {
  if (instance.empty()) return false;
  const std::lock_guard lock(mutex_);
  const auto found = std::find_if(entries_.begin(), entries_.end(), [&](const Entry& entry) { return entry.instance == instance; });
  return found != entries_.end() && std::find(found->objects.begin(), found->objects.end(), object) != found->objects.end();
}

}  // namespace docuvend::linux_platform
