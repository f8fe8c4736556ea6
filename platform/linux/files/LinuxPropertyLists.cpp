#include "platform/linux/files/LinuxPropertyLists.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <utility>
#include <variant>

#include "platform/linux/base/Shortage.h"
#include "platform/linux/files/DescriptorStream.h"
#include "platform/linux/files/FileReplacer.h"
#include "platform/linux/files/PropertyListParser.h"
#include "platform/linux/files/PropertyListWriter.h"

namespace docuvend::linux_platform {
namespace {

constexpr const char* kUnreadableSuffix = ".unreadable-";

bool isAbsence(int error) { return error == ENOENT || error == ENOTDIR; }

}  // namespace

std::unique_ptr<std::istream> LinuxPropertyLists::openStream(const std::string& path) {
  UniqueDescriptor file(::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  const int error = errno;
  {
    const std::lock_guard lock(mutex_);
    if (!file && isShortage(error)) {
      unread_.insert(path);
    } else {
      unread_.erase(path);
    }
  }
  if (!file && (isAbsence(error) || isShortage(error))) return nullptr;
  struct stat status {};
  if (file && (::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode))) file.reset();
  return std::make_unique<DescriptorStream>(std::move(file));
}

QXPropertyLists::ReadResult LinuxPropertyLists::read(std::istream& stream) {
  PropertyListParser parser;
  std::array<char, 16384> bytes{};
  bool wanted = true;
  while (wanted && stream) {
    stream.read(bytes.data(), bytes.size());
    wanted = parser.feed({bytes.data(), static_cast<std::size_t>(stream.gcount())});
  }
  if (stream.bad()) return {std::nullopt, noPropertyListError("The file cannot be read.")};
  auto result = parser.finish();
  if (auto* error = std::get_if<QXError>(&result)) return {std::nullopt, std::move(*error)};
  return {std::get<QXValue>(std::move(result)), std::nullopt};
}

bool LinuxPropertyLists::writeXMLAtomically(const QXDictionary& dictionary, const std::string& path) {
  const auto text = propertyListXML(dictionary);
  if (!text) return false;
  auto begun = FileReplacer::begin(path);
  auto* replacer = std::get_if<FileReplacer>(&begun);
  if (replacer == nullptr || replacer->write(*text)) return false;
  struct stat status {};
  if (::fstat(replacer->descriptor(), &status) != 0) return false;
  if (holdsSomethingElse(path) && replacer->keepOld(kUnreadableSuffix)) return false;
  if (replacer->commit()) return false;
  const std::lock_guard lock(mutex_);
  written_.insert_or_assign(path, stampOf(status));
  return true;
}

bool LinuxPropertyLists::keepBeside(const std::string& path) {
  auto begun = FileReplacer::begin(path);
  auto* replacer = std::get_if<FileReplacer>(&begun);
  return replacer != nullptr && !replacer->keepOld(kUnreadableSuffix);
}

LinuxPropertyLists::Stamp LinuxPropertyLists::stampOf(const struct stat& status) {
  return {status.st_dev, status.st_ino, status.st_mode, status.st_size, status.st_mtim.tv_sec, status.st_mtim.tv_nsec};
}

bool LinuxPropertyLists::holdsSomethingElse(const std::string& path) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return errno != ENOENT;
  {
    const std::lock_guard lock(mutex_);
    if (const auto found = written_.find(path); found != written_.end() && found->second == stampOf(status)) return false;
  }
  {
    const std::lock_guard lock(mutex_);
    if (unread_.contains(path)) return true;
  }
  const auto stream = openStream(path);
  return !stream || read(*stream).error;
}

}  // namespace docuvend::linux_platform
