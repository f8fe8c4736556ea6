#include "platform/linux/coordination/Remnants.h"

#include <optional>
#include <string>
#include <variant>

#include "platform/linux/coordination/BytesPresent.h"
#include "platform/provider_extension.h"

namespace docuvend::linux_platform {

bool Remnants::hasPlaceholder(const KeyedFile& file) const {
  const std::optional<BytesPresent> bytes = BytesPresent::of(file.key, file.url);
  return bytes && bytes->size > 0 && bytes->present == 0 && isInStorage(file.url);
}

// GROUPS/GROUP/Docuvend Storage/...
bool Remnants::isInStorage(const QXURL& file) const {
  const std::string path = file.fileSystemPath();
  const std::string storage = std::string("/").append(kQXProvidedItemsDirectoryName).append("/");
  for (std::size_t at = path.find(storage); at != std::string::npos; at = path.find(storage, at + 1)) {
    const std::size_t group = at == 0 ? std::string::npos : path.rfind('/', at - 1);
    if (group == std::string::npos) continue;
    const auto answer = fileSystem_.relationship(groupContainers_, QXURL::fileURL(path.substr(0, group + 1), QXURLKind::directory));
    const auto* relationship = std::get_if<QXRelationship>(&answer);
    if (relationship != nullptr && *relationship == QXRelationship::same) return true;
  }
  return false;
}

}  // namespace docuvend::linux_platform
