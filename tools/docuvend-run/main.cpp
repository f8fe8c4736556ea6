// docuvend-run BUNDLE-ID [ARGUMENT...]: starts an installed application confined to what belongs to it.
#include <fcntl.h>
#include <unistd.h>

#include <cstdio>
#include <string>
#include <vector>

#include "platform/linux/base/Paths.h"
#include "platform/linux/bundles/BundleScan.h"
#include "platform/linux/files/LinuxPropertyLists.h"
#include "platform/linux/launch/ConfinedLaunch.h"
#include "tools/docuvend-run/Complaint.h"
#include "tools/docuvend-run/HeldLog.h"
#include "tools/docuvend-run/OwnTerminal.h"
#include "tools/docuvend-run/UserTerminal.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kUsage = 2;
constexpr int kCannotLaunch = 125;
constexpr int kIsRoot = 126;
constexpr int kNoSuchBundle = 127;

constexpr const char* kHelp =
    "Usage: docuvend-run BUNDLE-ID [ARGUMENT...]\n"
    "\n"
    "Starts the installed application BUNDLE-ID, confined to its bundle, its container and its group containers.\n"
    "It gets descriptors 0 to 2, a cleared environment and its container as working directory and HOME, and ends\n"
    "with the process that started it. In place of those that are a terminal it gets a terminal of its own: what is\n"
    "typed reaches it only while it is in the foreground. ^C ends it, ^Z stops docuvend-run.\n"
    "\n"
    "Exit status: the application's own, 128 and its number when a signal ended it, or\n"
    "    1  bubblewrap could not build the confinement\n"
    "    2  the command line is wrong\n"
    "  125  the application could not be started\n"
    "  126  docuvend-run was started as root, whom it cannot confine\n"
    "  127  no such bundle is installed\n";

int fail(int status, const std::string& why) {
  complain(why);
  return status;
}

// A launcher may have closed them; a file that is opened later must not take their place.
bool holdStandardDescriptors() {
  int number = ::open("/dev/null", O_RDWR);
  while (number >= 0 && number <= STDERR_FILENO) number = ::dup(number);
  if (number < 0) return false;
  return ::close(number) == 0;
}

int run(const std::vector<std::string>& arguments) {
  if (arguments.empty()) return fail(kUsage, "name the bundle to start (--help says how)");
  if (arguments[0] == "--help") {
    std::fputs(kHelp, stdout);
    return 0;
  }
  if (arguments[0].starts_with("-")) return fail(kUsage, "unknown option " + arguments[0] + " (--help says what there is)");
  if (::geteuid() == 0) return fail(kIsRoot, "root cannot be confined; run this as a user");

  const auto paths = Paths::fromEnvironment();
  if (const auto* error = std::get_if<QXError>(&paths)) return fail(kCannotLaunch, error->description());
  HeldLog log;
  LinuxPropertyLists propertyLists;
  BundleScan scan(std::get<Paths>(paths), propertyLists, log);
  const auto look = scan.run();
  // A bundle that was not seen may come before the one that was, or let it belong to a group.
  if (look.notSeen) return fail(kCannotLaunch, look.notSeen->description());
  const auto bundle = look.bundles.find(arguments[0]);
  if (bundle == look.bundles.end()) {
    for (const auto& line : log.lines()) complain(line);
    return fail(kNoSuchBundle, "no bundle " + arguments[0] + " is installed");
  }

  auto plan = planLaunch(bundle->second, {arguments.begin() + 1, arguments.end()}, LaunchKind::application,
                         /*extensionSocket=*/std::nullopt, std::get<Paths>(paths));
  if (const auto* error = std::get_if<QXError>(&plan)) return fail(kCannotLaunch, error->description());
  UserTerminal terminal;
  if (terminal.replaced().empty()) return fail(kCannotLaunch, execute(std::get<LaunchPlan>(std::move(plan))).description());
  const auto ending = OwnTerminal(terminal).run(std::get<LaunchPlan>(std::move(plan)));
  if (const auto* error = std::get_if<QXError>(&ending)) return fail(kCannotLaunch, error->description());
  return std::get<int>(ending);
}

}  // namespace
}  // namespace docuvend::linux_platform

int main(int count, char** words) {
  if (!docuvend::linux_platform::holdStandardDescriptors()) return docuvend::linux_platform::kCannotLaunch;
  return docuvend::linux_platform::run({words + 1, words + count});
}
