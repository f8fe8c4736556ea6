// An installed bundle: a directory with Info.plist and, beside it, Entitlements.plist.
//
// Info.plist holds the strings "QXBundleIdentifier" and "QXBundleExecutable" (a path relative to the bundle), the array of strings
// "QXGroups" (groups that the bundle asks to belong to), the dictionary "QXGroupMembers" (of groups that this bundle owns, which are named
// like it with one part more: group to array of other bundles' identifiers) and, for an extension, the dictionary "QXExtension".
#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/QXURL.h"
#include "platform/QXValue.h"

namespace docuvend::linux_platform {

struct Bundle {
  std::string identifier;
  std::string directory;   // absolute
  std::string executable;  // absolute, inside the directory
  QXDictionary info;
  QXDictionary entitlements;                               // empty when there is no Entitlements.plist
  std::map<std::string, std::string, std::less<>> groups;  // groups that it belongs to: group to absolute container directory
  std::string container;                                   // its own container directory, absolute
  // Differs after every installation or update of the bundle, and when it has come to belong to other groups (device, inode and change
  // times of the directory and its files, and the groups' names).
  std::string version;
  // Tells this directory from every other that has had its name or will have it: the same when the bundle is edited in place, another after
  // it was removed or replaced and after every `docuvendctl install` (device, inode, time of birth; digits and dots). Where the file system
  // knows no time of birth an inode's number that is given again is not told from the first.
  std::string incarnation;
};

// What is installed. May be used from any thread.
class BundleRegistry {
 public:
  BundleRegistry() = default;
  BundleRegistry(const BundleRegistry&) = delete;
  BundleRegistry& operator=(const BundleRegistry&) = delete;
  virtual ~BundleRegistry() = default;

  [[nodiscard]] virtual std::optional<Bundle> find(const std::string& identifier) = 0;
  // Ordered by identifier.
  [[nodiscard]] virtual std::vector<Bundle> all() = 0;
  // Calls back, on a thread of the registry's, after anything was installed, updated or removed. For the life of the registry.
  virtual void onChange(std::function<void()> callback) = 0;
};

}  // namespace docuvend::linux_platform
