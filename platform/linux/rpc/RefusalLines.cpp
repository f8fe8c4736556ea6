#include "platform/linux/rpc/RefusalLines.h"

namespace docuvend::linux_platform {

bool RefusalLines::isDue(const std::string& peer, Time now) {
  std::erase_if(written_, [now](const auto& line) { return now - line.second >= kTimeBetweenRefusalLines; });
  return written_.emplace(peer, now).second;
}

}  // namespace docuvend::linux_platform
