#include "platform/linux/bundles/BundleIdentifier.h"

#include <algorithm>

namespace docuvend::linux_platform {
namespace {

bool isAllowed(char c) { return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '-' || c == '.'; }

}  // namespace

bool isBundleIdentifier(std::string_view text) {
  if (text.empty() || text.size() > kLongestIdentifier) return false;
  if (text.front() == '-' || text.front() == '.' || text.back() == '.') return false;
  return text.find("..") == std::string_view::npos && std::all_of(text.begin(), text.end(), isAllowed);
}

bool hasSeveralParts(std::string_view identifier) { return identifier.find('.') != std::string_view::npos; }

}  // namespace docuvend::linux_platform
