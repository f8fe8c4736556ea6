#include "platform/linux/files/StraightURL.h"

#include <algorithm>
#include <iterator>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "platform/linux/files/FilePlace.h"

namespace docuvend::linux_platform {
namespace {

// The URL with one slash wherever it has several, its escapes as they are spelled.
std::optional<QXURL> withSingleSlashes(const QXURL& url) {
  constexpr std::string_view kScheme = "file://";
  const std::string& text = url.absoluteString();
  std::string single(kScheme);
  std::unique_copy(text.begin() + kScheme.size(), text.end(), std::back_inserter(single),
                   [](char a, char b) { return a == '/' && b == '/'; });
  return QXURL::fromString(single);
}

}  // namespace

QXURL straightURL(const QXURL& url) {
  const std::string path = url.fileSystemPath();
  const auto found = FilePlace::ofItem(path);
  const auto* place = std::get_if<FilePlace>(&found);
  if (place == nullptr) return url;
  const std::string straight = place->path();
  if (straight == path || !qxIsValidUTF8(straight)) return url;
  if (auto single = withSingleSlashes(url); single && single->fileSystemPath() == straight) return *std::move(single);
  return QXURL::fileURL(straight, url.hasDirectoryPath() ? QXURLKind::directory : QXURLKind::file);
}

bool leadsBelow(const QXURL& straight, const std::string& directory) {
  const auto place = FilePlace::ofDirectory(directory);
  const auto* above = std::get_if<FilePlace>(&place);
  return above != nullptr && FilePlace{straight.fileSystemPath(), {}}.isBelow(*above);
}

}  // namespace docuvend::linux_platform
