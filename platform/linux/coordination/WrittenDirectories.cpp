#include "platform/linux/coordination/WrittenDirectories.h"

#include <utility>
#include <variant>

#include "platform/linux/sandbox/Resolution.h"

namespace docuvend::linux_platform {

std::optional<HeldDirectory> HeldDirectory::of(const KeyedFile& file) {
  const std::string path = file.url.fileSystemPath();
  OpenedPath opened = openDirectory(path.substr(0, path.rfind('/') + 1));
  auto* directory = std::get_if<UniqueDescriptor>(&opened);
  if (directory == nullptr) return std::nullopt;
  const auto status = statusOf(directory->get());
  const auto* present = std::get_if<ObjectStatus>(&status);
  if (present == nullptr || present->identity != file.key.directory) return std::nullopt;
  return HeldDirectory(std::move(*directory));
}

// The kernel names a directory that was removed too, by a path that leads nowhere or somewhere else.
KeyedFile HeldDirectory::whereIsNow(const KeyedFile& file) const {
  const auto now = KeyedFile::in(directory_.get(), file.key.name, file.url);
  const auto* found = std::get_if<KeyedFile>(&now);
  return found != nullptr && found->url != file.url && found->isInPlace() ? *found : file;
}

void WrittenDirectories::add(AccessNumber number, const Application& application, HeldDirectory directory) {
  std::size_t& count = counts_[application];
  if (count == (application ? kMaximumHeld : kMaximumUnconfinedHeld)) return;
  ++count;
  held_.insert_or_assign(number, Held{application, std::move(directory)});
}

std::optional<HeldDirectory> WrittenDirectories::take(AccessNumber number) {
  auto taken = held_.extract(number);
  if (taken.empty()) return std::nullopt;
  const auto count = counts_.find(taken.mapped().application);
  if (--count->second == 0) counts_.erase(count);
  return std::move(taken.mapped().directory);
}

}  // namespace docuvend::linux_platform
