// Puts bundles into the user's bundle directory and takes them away again, while anybody may be looking there.
//
// A bundle is copied under a hidden name beside its place, examined there as the registry would examine it, forced to disk, and then put
// in place by one rename; the older copy of its identifier changes places with it, whatever its directory is called, and is removed
// afterwards. Whoever looks sees the old bundle or the new one. A process that is killed on the way leaves one of these and at most
// directories under hidden names, which the next installer clears away. Installers take turns, so what lies under such a name and an
// installer finds is held by no other.
//
// A copy is made of directories, regular files and links that lead to something inside the bundle. Its files are readable by everybody,
// writable by the user, and executable if the original is; it has no attributes of the original beside that. Anything else in a bundle is
// refused, and so is one that is larger than an installer takes (BundleCopy.h).
//
// A bundle that claims a group of another's or of nobody's, or to say who the members of one are, is refused (GroupMembership.h). The
// user's directory is made for the user alone, and closed to others who can write it.
//
// A program that was started from the older copy or from a removed bundle keeps running, but opens no further file of its bundle, and is
// nobody to the daemon (PeerIdentity.h).
//
// Containers and group containers are the user's data: they are neither made nor removed. May be used from any thread and from several
// processes at once; a call waits until other installers are through.
#pragma once

#include <optional>
#include <string>
#include <variant>

#include "platform/QXError.h"
#include "platform/linux/base/Paths.h"
#include "platform/property_list.h"

namespace docuvend::linux_platform {

struct InstalledBundle {
  enum class Outcome { installed, updated };

  std::string identifier;
  std::string directory;  // where it lies now, absolute
  Outcome outcome;
};

// Installs the bundle that the directory holds, which stays as it is, or updates it if its identifier is installed. An error of
// kBundleErrorDomain (BundleErrors.h) when the bundle cannot be had, of the system's when a call failed or another bundle could not be
// looked at (Seen.h), which may be a copy of this one or the owner of its group. The old state is then whole, or,
// when only forcing the change to disk or removing a further copy failed, the new one.
[[nodiscard]] std::variant<InstalledBundle, QXError> installBundle(const std::string& directory, const Paths& paths,
                                                                   QXPropertyLists& propertyLists);

// Removes every copy of the identifier from the user's directory, and what lies there under that name while a lease keeps its property
// lists from being read. Likewise an error; notFound when there is none.
[[nodiscard]] std::optional<QXError> uninstallBundle(const std::string& identifier, const Paths& paths, QXPropertyLists& propertyLists);

}  // namespace docuvend::linux_platform
