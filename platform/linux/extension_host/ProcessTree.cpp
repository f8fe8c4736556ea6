// A confinement is a process outside it that waits for the first process inside. To end the inner one is to end all that runs inside, for
// it is the first of its process namespace. It asks the kernel to be ended together with the outer one, but only when it is nearly ready:
// killed while the confinement is being made, the outer process would leave the inner one behind, waiting for ever for a word from it.
//
// So the outer process is stopped first. Then it makes no more children and reaps none, so the numbers of its children are theirs.
#include "platform/linux/extension_host/ProcessTree.h"

#include <signal.h>
#include <sys/wait.h>

#include <fstream>
#include <string>

#include "platform/linux/base/pidfd.h"

namespace docuvend::linux_platform {

void endProcessTree(const SpawnedProcess& process) {
  signalPidfd(process.descriptor, SIGSTOP);
  siginfo_t info{};
  waitid(P_PIDFD, static_cast<id_t>(process.descriptor.get()), &info, WSTOPPED | WEXITED | WNOWAIT);
  if (info.si_code == CLD_STOPPED) {
    const std::string number = std::to_string(process.number);
    std::ifstream children("/proc/" + number + "/task/" + number + "/children");
    for (pid_t child = 0; children >> child;) {
      const UniqueDescriptor descriptor = openPidfd(child);
      if (descriptor) signalPidfd(descriptor, SIGKILL);
    }
  }
  signalPidfd(process.descriptor, SIGKILL);
}

}  // namespace docuvend::linux_platform
