#include "platform/linux/sandbox/RedemptionLedger.h"

#include <algorithm>
#include <utility>

namespace docuvend::linux_platform {

void RedemptionLedger::enter(const std::string& instance, Written written) {
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
  std::erase_if(objects, [&written](const Written& other) { return other.object == written.object; });
  if (objects.size() == kMaximumObjectsPerInstance) objects.pop_front();
  objects.push_back(std::move(written));
}

void RedemptionLedger::forgetBelow(const std::vector<std::string>& directories) {
  const auto liesBelow = [&directories](const Written& written) {
    return std::any_of(directories.begin(), directories.end(),
                       [&written](const std::string& directory) { return written.path.starts_with(directory); });
  };
  const std::lock_guard lock(mutex_);
  for (Entry& entry : entries_) std::erase_if(entry.objects, liesBelow);
  std::erase_if(entries_, [](const Entry& entry) { return entry.objects.empty(); });
}

void RedemptionLedger::forgetAll() {
  const std::lock_guard lock(mutex_);
  entries_.clear();
}

bool RedemptionLedger::holds(const std::string& instance, const ObjectIdentity& object) const {
  if (instance.empty()) return false;
  const std::lock_guard lock(mutex_);
  const auto found = std::find_if(entries_.begin(), entries_.end(), [&](const Entry& entry) { return entry.instance == instance; });
  return found != entries_.end() &&
         std::any_of(found->objects.begin(), found->objects.end(), [&object](const Written& written) { return written.object == object; });
}

}  // namespace docuvend::linux_platform
