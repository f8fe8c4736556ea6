// Says that something may have changed at or below a few paths, also when they do not exist yet.
#pragma once

#include <map>
#include <set>
#include <string>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

// Used by one thread.
class DirectoryWatch {
 public:
  DirectoryWatch();

  // Becomes readable when there are events; -1 when the kernel gave no watch.
  [[nodiscard]] int descriptor() const { return queue_.get(); }

  // From now on watches what happens directly in each directory of `whole`, and whether the directories of `whole` come and go, however
  // much of their paths exists. False when the kernel refused a watch on something that exists.
  [[nodiscard]] bool watch(const std::vector<std::string>& whole);

  // Takes every event that waits; true when one of them matters. Lost events matter.
  [[nodiscard]] bool takeEvents();

 private:
  [[nodiscard]] bool watchWhole(const std::string& path);
  [[nodiscard]] bool watchWay(const std::string& path);
  [[nodiscard]] bool add(const std::string& path, unsigned mask, const std::string& name);

  UniqueDescriptor queue_;
  // Watch to the names whose events matter; an empty set: all of them.
  std::map<int, std::set<std::string>> watches_;
  std::map<int, std::set<std::string>> wanted_;  // what `watch` is collecting
};

}  // namespace docuvend::linux_platform
