// Says what may have changed at or below a few paths, also when they do not exist yet.
#pragma once

#include <map>
#include <set>
#include <string>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

struct DirectoryChange {
  enum class Kind {
    written,     // something is being written or made there
    cameOrWent,  // the entry was renamed from, to or within the directory, or removed
    lost,        // something was missed; neither directory nor name are known
  };
  Kind kind;
  std::string directory;  // as it was given
  std::string name;       // of the entry; empty when it is the directory itself
  bool isOfDirectory;     // the change is of a directory, so that there may be others to watch now
};

// Used by one thread.
class DirectoryWatch {
 public:
  // Becomes readable when there are events; -1 as long as the kernel has given no queue for them.
  [[nodiscard]] int descriptor() const { return queue_.get(); }

  // From now on watches what happens directly in each directory of `whole`, and whether the directories of `whole` come and go, however
  // much of their paths exists. False when the kernel refused the queue, or a watch on something that exists: a user has so many of both,
  // and any process may have taken them. Another call asks again.
  [[nodiscard]] bool watch(const std::vector<std::string>& whole);

  // Takes every event that waits; those that matter, in their order. When an entry that is itself watched came or went, nothing more is
  // heard from it or from below it until the next `watch`.
  [[nodiscard]] std::vector<DirectoryChange> takeChanges();

 private:
  struct Watched {
    std::string path;
    std::set<std::string> names;  // the names whose events matter; empty: all of them
  };

  [[nodiscard]] bool watchWhole(const std::string& path);
  [[nodiscard]] bool watchWay(const std::string& path);
  [[nodiscard]] bool add(const std::string& path, unsigned mask, const std::string& name);
  void forgetBelow(const std::string& path);

  UniqueDescriptor queue_;
  std::set<int> numbers_;           // all that the kernel watches
  std::map<int, Watched> watches_;  // those of them that are listened to
  std::map<int, Watched> wanted_;   // what `watch` is collecting
};

}  // namespace docuvend::linux_platform
