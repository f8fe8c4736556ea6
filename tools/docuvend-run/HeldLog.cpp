#include "tools/docuvend-run/HeldLog.h"

namespace docuvend {

void HeldLog::write(QXLogType type, const std::string& message) {
  if (isEnabled(type)) lines_.push_back(message);
}

}  // namespace docuvend
