// Places paths below the group containers of the installed bundles: the only files that tokens are for.
//
// A container's own directory is the registry's word and may be reached through links; below it nothing may: no symbolic link, no "..",
// no other mount. May be used from any thread.
#pragma once

#include <atomic>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/sandbox/Resolution.h"

namespace docuvend::linux_platform {

enum class PathRefusal {
  notAbsolute,
  malformed,  // "." or "..", NUL, a final slash, too long
  outsideContainers,
  noParent,  // the directory that should hold it is not there
  symbolicLink,
  notRegularFile,
  severalLinks,
  unsteady,     // renamed again and again while it was looked at; or not in the kernel's cache, where only that is looked at
  unreachable,  // the system refuses for another reason
};

[[nodiscard]] std::string_view describe(PathRefusal refusal);

// A regular file with one link, as it was when it was looked at.
struct PlacedFile {
  UniqueDescriptor path;  // O_PATH
  ObjectIdentity identity;
};

struct PlacedItem {
  std::string path;            // free of links and doubled slashes
  UniqueDescriptor directory;  // O_PATH of the directory that holds it
  std::string name;
  std::optional<PlacedFile> file;  // none: nothing has that name yet
};

class GroupContainers {
 public:
  explicit GroupContainers(BundleRegistry& registry);

  [[nodiscard]] std::variant<PlacedItem, PathRefusal> place(const std::string& path, Lookup lookup = Lookup::complete);

  // Directories without links, each with a final slash: below one of them lies every path that `place` has given, or may give, for a file
  // below that directory, whether or not it exists. Everything ("/") when the directory's path is malformed.
  [[nodiscard]] std::vector<std::string> spellingsOf(const std::string& directory);

 private:
  struct Root {
    UniqueDescriptor directory;
    std::string path;   // free of links
    std::string below;  // what of the asked path lies below it
  };

  [[nodiscard]] std::vector<std::string> directories();
  [[nodiscard]] std::variant<Root, PathRefusal> rootOf(const std::string& path);

  BundleRegistry& registry_;
  // Set by the registry's thread, which may outlive this object.
  const std::shared_ptr<std::atomic<bool>> stale_ = std::make_shared<std::atomic<bool>>(true);
  std::mutex mutex_;
  std::vector<std::string> directories_;  // guarded by mutex_
};

// What has that name in the directory, if anything; only a regular file with one link will do.
[[nodiscard]] std::variant<std::optional<PlacedFile>, PathRefusal> placeEntry(int directory, const std::string& name,
                                                                              Lookup lookup = Lookup::complete);

}  // namespace docuvend::linux_platform
