#include <cerrno>
#include <charconv>
#include <cstdint>
#include <memory>

#include "platform/linux/files/LinuxDeviceLock.h"
#include "tools/docuvendctl/CommandTable.h"
#include "tools/docuvendctl/ConnectionOptions.h"
#include "tools/docuvendctl/Operands.h"
#include "tools/docuvendctl/Outcome.h"
#include "tools/docuvendctl/Place.h"

namespace docuvend::ctl {
namespace {

using linux_platform::LockState;
using linux_platform::Paths;

constexpr int kGreatestState = 999;

LockState currentState(const Paths& paths) { return linux_platform::readLockState(paths.lockState).value_or(LockState{}); }

Failure write(const Paths& paths, const LockState& state) {
  if (auto failure = linux_platform::prepareRuntimeDirectories(paths)) return failure;
  return linux_platform::writeLockState(paths.lockState, state);
}

// What the operands make of the state as it is.
Result<LockState> changed(LockState state, const Call& call) {
  const std::string& number = call.operands[0];
  const char* end = number.data() + number.size();
  const auto [stopped, error] = std::from_chars(number.data(), end, state.state);
  if (error != std::errc{} || stopped != end || state.state < 0 || state.state > kGreatestState) {
    return makeControlError(ControlErrorCode::usage, "STATE is a number from 0 to " + std::to_string(kGreatestState));
  }
  if (call.operands.size() == 1) return state;
  const std::string& word = call.operands[1];
  if (word != "locked" && word != "unlocked") return makeControlError(ControlErrorCode::usage, "behind STATE goes locked or unlocked");
  state.unlockedSinceBoot = word == "unlocked";
  return state;
}

Result<Answer> lockState(const Call& call) {
  auto found = unconfinedPaths();
  if (auto* error = std::get_if<QXError>(&found)) return *error;
  const Paths& paths = std::get<Paths>(found);
  const LockState state = currentState(paths);
  if (call.operands.empty()) {
    return Answer(Record{{{"state", QXValue(state.state)}, {"unlockedSinceBoot", QXValue(state.unlockedSinceBoot)}}});
  }
  auto wanted = changed(state, call);
  if (auto* error = std::get_if<QXError>(&wanted)) return *error;
  return done(write(paths, std::get<LockState>(wanted)));
}

// Nobody listens, so that no daemon of this user runs.
bool isNotRunning(const QXError& error) {
  if (error.domain != kConsumerErrorDomain || error.code != static_cast<std::int64_t>(ConsumerErrorCode::unreachable)) return false;
  const QXError* reason = error.underlying.get();
  return reason != nullptr && reason->domain == kQXSystemErrorDomain && (reason->code == ENOENT || reason->code == ECONNREFUSED);
}

// The file comes first: a daemon that cannot be told yet reads it later in its start.
Result<Answer> firstUnlock(const Call& call) {
  auto found = unconfinedPaths();
  if (auto* error = std::get_if<QXError>(&found)) return *error;
  const Paths& paths = std::get<Paths>(found);
  LockState state = currentState(paths);
  state.unlockedSinceBoot = true;
  if (auto failure = write(paths, state)) return *failure;

  auto connected = Administrator::connect(administratorOptions(call.deadline));
  if (const auto* error = std::get_if<QXError>(&connected)) return done(isNotRunning(*error) ? std::nullopt : Failure(*error));
  return done(std::get<std::unique_ptr<Administrator>>(connected)->announceFirstUnlock());
}

}  // namespace

CommandGroup platformCommands() {
  return {"The platform, for greeters and login hooks (not from inside a confinement)",
          {
              {"platform lock-state",
               "[STATE [locked|unlocked]]",
               {},
               "show or set the device's lock state",
               "STATE is a number from 0 to 999; 3 stands for a device without lock protection, where there is nothing to wait for.\n"
               "The word behind it says whether the device has been unlocked since it was started; without it that stays as it is.\n"
               "A daemon reads both when it starts. Without operands prints: state, unlockedSinceBoot.\n",
               lockState},
              {"platform first-unlock",
               "",
               {},
               "the device has been unlocked for the first time",
               "Remembers it for daemons that start later, and tells a running one, which then rereads its list and finds its\n"
               "providers. Harmless when it has been said before. Prints nothing.\n",
               firstUnlock},
          }};
}

}  // namespace docuvend::ctl
