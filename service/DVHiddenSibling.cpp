#include "service/DVHiddenSibling.h"

#include <string>

namespace docuvend {
namespace {

// "file:///a//b/" becomes "file:/a/b", which is the same URL but for its spelling.
std::string withSingleSlashes(const std::string& text) {
  std::string single;
  single.reserve(text.size());
  for (const char c : text) {
    if (c != '/' || !single.ends_with('/')) single += c;
  }
  if (single.ends_with('/')) single.pop_back();
  return single;
}

}  // namespace

std::optional<QXURL> dvHiddenSiblingURL(const QXURL& url) {
  std::string text = withSingleSlashes(url.absoluteString());
  const std::size_t lastSlash = text.rfind('/');
  if (lastSlash == std::string::npos) return std::nullopt;
  return QXURL::fromString(text.insert(lastSlash + 1, 1, '.'));
}

}  // namespace docuvend
