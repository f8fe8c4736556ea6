// Where a path leads: the kernel's name of what exists, and the rest that does not exist yet.
#pragma once

#include <string>
#include <variant>

#include "platform/linux/base/Lookup.h"

namespace docuvend::linux_platform {

// What becomes of a link that is the path's last component. A link that is refused is no directory.
enum class LastLink { followed, refused };

struct FilePlace {
  std::string existing;  // absolute, without links, "." and ".."
  std::string missing;   // components below it, without "." and ".."; empty when all of the path exists

  // The errno value when the path leads nowhere.
  using Result = std::variant<FilePlace, int>;

  // Links are followed, those too that point to what does not exist yet. ENOENT when a missing component is followed by "..".
  [[nodiscard]] static Result ofItem(const std::string& path);
  // ENOENT when there is no such directory, ENOTDIR when it is something else. Links on the way are followed. A kernel that cannot look in
  // its cache alone (before 5.12) looks completely.
  [[nodiscard]] static Result ofDirectory(const std::string& path, LastLink lastLink = LastLink::followed,
                                          Lookup lookup = Lookup::complete);

  // Its one name without links.
  [[nodiscard]] std::string path() const;
  // True when that path, which leads here, does so over no link.
  [[nodiscard]] bool isNamedBy(const std::string& path) const;
  // True when this place is somewhere below that directory; false for the directory itself.
  [[nodiscard]] bool isBelow(const FilePlace& directory) const;

  friend bool operator==(const FilePlace&, const FilePlace&) = default;
};

}  // namespace docuvend::linux_platform
