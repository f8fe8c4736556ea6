#include "tools/docuvend-run/Complaint.h"

#include <cstdio>

#include "platform/linux/log/LogText.h"

namespace docuvend {

void complain(const std::string& why) { std::fprintf(stderr, "docuvend-run: %s\n", linux_platform::visibleLogText(why).c_str()); }

}  // namespace docuvend
