#include "platform/linux/launch/PrivatePlaces.h"

namespace docuvend::linux_platform {

std::optional<std::string> exposedPlace(const HostLayout& host, const Paths& paths) {
  // Each may be reached through a link of its own.
  for (const std::string& path :
       {paths.home, paths.home + "/Library/Docuvend", paths.userBundles, paths.containers, paths.groupContainers, paths.runtime}) {
    if (const auto shown = host.shownAround(path)) return path + " lies below " + *shown + ", which every application sees";
  }
  return std::nullopt;
}

}  // namespace docuvend::linux_platform
