#include "platform/linux/extension_host/OutputLines.h"

#include <algorithm>

#include "platform/QXURL.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::size_t kLongestCharacter = 4;

}  // namespace

void OutputLines::add(std::string_view bytes) {
  while (!bytes.empty()) {
    const std::size_t end = bytes.find('\n');
    const std::string_view part = bytes.substr(0, end);
    line_.append(part.substr(0, kLongestLine - line_.size()));
    if (end == std::string_view::npos) return;
    finish();
    bytes.remove_prefix(end + 1);
  }
}

void OutputLines::finish() {
  if (line_.empty()) return;
  dropCutCharacter();
  if (!qxIsValidUTF8(line_)) {
    std::replace_if(
        line_.begin(), line_.end(), [](char c) { return static_cast<unsigned char>(c) >= 0x80U; }, '?');
  }
  sink_(line_);
  line_.clear();
}

void OutputLines::dropCutCharacter() {
  if (line_.size() < kLongestLine) return;
  std::size_t start = line_.size() - 1;
  while (start > line_.size() - kLongestCharacter && (static_cast<unsigned char>(line_[start]) & 0xC0U) == 0x80U) --start;
  if (!qxIsValidUTF8(std::string_view(line_).substr(start))) line_.resize(start);
}

}  // namespace docuvend::linux_platform
