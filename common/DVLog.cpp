#include "common/DVLog.h"

#include "platform/QXPlatform.h"

namespace docuvend {

QXLogHandle& dv_default_log() { return QXPlatform::current().log.defaultLog(); }

std::string dvShortened(std::string text) {
  if (text.size() <= kDVLongestLoggedValue) return text;
  std::size_t length = kDVLongestLoggedValue;
  const auto continuesCharacter = [&text](std::size_t at) { return (static_cast<unsigned char>(text[at]) & 0xC0U) == 0x80U; };
  while (length > 0 && continuesCharacter(length)) --length;
  text.resize(length);
  return text.append("…");
}

}  // namespace docuvend
