#include "tools/docuvend-run/HeldLog.h"

namespace docuvend {

void HeldLog::write(QXLogType type, const std::string& message) {
  if (!isEnabled(type)) return;
  std::string& line = lines_.emplace_back(message);
  for (char& c : line) {
    if (static_cast<unsigned char>(c) < ' ' || c == '\x7f') c = '?';
  }
}

}  // namespace docuvend
