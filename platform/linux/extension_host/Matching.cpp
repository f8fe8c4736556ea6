#include "platform/linux/extension_host/Matching.h"

#include <algorithm>
#include <string>

namespace docuvend::linux_platform {

bool hasAttributes(const Bundle& bundle, const QXExtensionHost::Attributes& attributes) {
  const auto* extension = qxFind<QXDictionary>(bundle.info, "QXExtension");
  if (extension == nullptr) return false;
  return std::all_of(attributes.begin(), attributes.end(), [extension](const auto& attribute) {
    const auto* value = qxFind<std::string>(*extension, attribute.first);
    return value != nullptr && *value == attribute.second;
  });
}

bool isSameInstallation(const Bundle& a, const Bundle& b) {
  // The groups may change with another bundle's installation.
  return a.identifier == b.identifier && a.incarnation == b.incarnation && a.version == b.version && a.directory == b.directory &&
         a.executable == b.executable && a.info == b.info && a.entitlements == b.entitlements && a.groups == b.groups &&
         a.container == b.container;
}

bool isSuccessor(const Bundle& before, const Bundle& now) {
  return before.identifier == now.identifier && before.directory == now.directory && before.container == now.container &&
         before.entitlements == now.entitlements &&
         std::includes(now.groups.begin(), now.groups.end(), before.groups.begin(), before.groups.end());
}

}  // namespace docuvend::linux_platform
