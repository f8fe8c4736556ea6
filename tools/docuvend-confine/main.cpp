// Runs inside a confinement, between bubblewrap and the bundle's executable: takes away what the mounts leave open, then becomes the
// executable. Its arguments are described in platform/linux/launch/policy/ConfinePolicy.h; it reads nothing else.
#include <linux/keyctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/launch/policy/ConfinePolicy.h"
#include "platform/linux/launch/policy/Landlock.h"
#include "platform/linux/launch/policy/SystemCalls.h"
#include "platform/linux/log/LogText.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kFailed = 125;

int fail(const std::string& why) {
  std::fprintf(stderr, "docuvend-confine: %s\n", visibleLogText(why).c_str());
  return kFailed;
}

// A tighter limit that was inherited stays.
std::optional<QXError> limit(__rlimit_resource resource, std::optional<std::uint64_t> most) {
  if (!most) return std::nullopt;
  rlimit limit{};
  if (::getrlimit(resource, &limit) != 0) return QXError::system(errno, "cannot read a limit");
  limit.rlim_max = std::min<rlim_t>(limit.rlim_max, *most);
  limit.rlim_cur = std::min<rlim_t>(limit.rlim_cur, limit.rlim_max);
  if (::setrlimit(resource, &limit) != 0) return QXError::system(errno, "cannot set a limit");
  return std::nullopt;
}

// The launcher's session keyring is inherited by everything it starts, with the keys in it. A kernel without keyrings has none to hide. A
// new keyring counts against the quota of the user's keys: where others have used that up the inherited one stays, and it is out of reach
// all the same, since the filter on system calls lets nobody inside use a key.
std::optional<QXError> leaveKeyring() {
  if (::syscall(SYS_keyctl, KEYCTL_JOIN_SESSION_KEYRING, nullptr) >= 0 || errno == ENOSYS || errno == EDQUOT) return std::nullopt;
  return QXError::system(errno, "cannot leave the session keyring");
}

int run(const std::vector<std::string>& arguments) {
  auto parsed = parseConfineArguments(arguments);
  if (const auto* problem = std::get_if<std::string>(&parsed)) return fail(*problem);
  auto& [policy, command] = std::get<ConfineCommand>(parsed);

  if (const auto error = leaveKeyring()) return fail(error->description());
  if (const auto error = limit(RLIMIT_NPROC, policy.processes)) return fail(error->description());
  if (const auto error = limit(RLIMIT_DATA, policy.memory)) return fail(error->description());
  if (const auto error = limit(RLIMIT_NOFILE, policy.openFiles)) return fail(error->description());
  if (const auto error = limit(RLIMIT_SIGPENDING, policy.pendingSignals)) return fail(error->description());
  if (const auto error = limit(RLIMIT_MEMLOCK, policy.lockedMemory)) return fail(error->description());
  if (const auto error = limit(RLIMIT_MSGQUEUE, kConfinedMessageQueueBytes)) return fail(error->description());
  if (const auto error = restrictToRules(policy.rules, landlockLevel())) return fail(error->description());
  if (const auto error = refuseSystemCalls(policy.leases)) return fail(error->description());
  if (::close_range(static_cast<unsigned>(policy.descriptors), UINT_MAX, 0) != 0) return fail("cannot close the other descriptors");

  std::vector<char*> words;
  words.reserve(command.size() + 1);
  for (auto& word : command) words.push_back(word.data());
  words.push_back(nullptr);
  ::execv(words[0], words.data());
  return fail(QXError::system(errno, "cannot execute " + command[0]).description());
}

}  // namespace
}  // namespace docuvend::linux_platform

int main(int count, char** words) { return docuvend::linux_platform::run({words + 1, words + count}); }
