// Two walls stand around a bundle's process, because each leaves something open. The mount namespace shows nothing of the home and of the
// run-time directory but what belongs to the bundle, and no change of metadata reaches a read-only mount; but a descriptor that was
// passed in can be reopened for writing, and ".." leads out of a directory that was passed in. Landlock closes these, and with them
// abstract sockets and signals; but it has no say over metadata, nor over sockets that have a path.
//
// Mounts are made in the order of the arguments: /tmp comes before the directories, some of which may lie below it, and the root becomes
// read-only when all is in its place.
#include "platform/linux/launch/LaunchArguments.h"

#include <algorithm>
#include <array>

#include "platform/linux/base/confinement.h"
#include "platform/linux/launch/policy/Landlock.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::array kDevices = {"/dev/full", "/dev/null", "/dev/random", "/dev/urandom", "/dev/zero"};
constexpr const char* kSharedMemory = "/dev/shm";
constexpr const char* kTemporary = "/tmp";
constexpr const char* kProcesses = "/proc";

// An old kernel's Landlock leaves abstract sockets open; then an application goes without a network, and with it without them.
bool hasNetwork(const LaunchSubject& subject, const HostLayout& host) {
  return subject.kind == LaunchKind::extension || host.landlockLevel >= kLandlockScopesLevel;
}

// Of what everybody of this user shares.
std::uint64_t halfOf(const std::optional<std::uint64_t>& all, std::uint64_t most) {
  if (!all) return most;
  return std::clamp<std::uint64_t>(*all / 2, 1, most);
}

void setLimits(ConfinePolicy& policy, LaunchKind kind, const HostLayout& host) {
  const bool isExtension = kind == LaunchKind::extension;
  if (host.landlockLevel >= kProcessLimitLevel) {
    policy.processes = isExtension ? kExtensionProcesses : halfOf(host.processes, kApplicationProcesses);
  }
  policy.openFiles = isExtension ? kExtensionOpenFiles : halfOf(host.openFiles, kApplicationOpenFiles);
  policy.pendingSignals = halfOf(host.pendingSignals, kConfinedPendingSignals);
  policy.lockedMemory = halfOf(host.lockedMemory, kConfinedLockedMemory);
  if (isExtension) policy.memory = kExtensionMemory;
}

class Arguments {
 public:
  template <class... Words>
  void add(Words&&... words) {
    (words_.emplace_back(std::forward<Words>(words)), ...);
  }
  void bindReadOnly(const std::string& path) { add("--ro-bind", path, path); }
  void bindWritable(const std::string& path) { add("--bind", path, path); }
  [[nodiscard]] std::vector<std::string> take() { return std::move(words_); }

 private:
  std::vector<std::string> words_;
};

void addNamespaces(Arguments& arguments, const LaunchSubject& subject, const HostLayout& host) {
  arguments.add("--unshare-user", "--unshare-pid", "--unshare-ipc", "--unshare-uts", "--unshare-cgroup-try");
  if (!hasNetwork(subject, host)) arguments.add("--unshare-net");
  arguments.add("--disable-userns", "--cap-drop", "ALL", "--new-session", "--die-with-parent");
}

void addSystem(Arguments& arguments, const LaunchSubject& subject, const HostLayout& host) {
  for (const auto& path : host.systemDirectories) arguments.bindReadOnly(path);
  for (const auto& [path, target] : host.systemLinks) arguments.add("--symlink", target, path);
  for (const auto& path : host.systemFiles) arguments.bindReadOnly(path);
  if (hasNetwork(subject, host)) {
    for (const auto& path : host.networkFiles) arguments.bindReadOnly(path);
  }
  arguments.add("--proc", kProcesses, "--dev", "/dev", "--perms", "0700", "--tmpfs", kTemporary);
}

void addOwn(Arguments& arguments, const LaunchSubject& subject, const HostLayout& host) {
  arguments.bindReadOnly(subject.bundleDirectory);
  arguments.bindWritable(subject.container);
  for (const auto& path : subject.groups) arguments.bindWritable(path);
  if (subject.kind == LaunchKind::application) arguments.bindReadOnly(subject.publicSockets);
  arguments.add("--ro-bind", host.helper, kHelperPath);
  arguments.add("--ro-bind-data", std::to_string(subject.descriptionDescriptor), kDescriptionPath);
  arguments.add("--remount-ro", "/", "--chdir", subject.container);
}

}  // namespace

ConfinePolicy confinePolicy(const LaunchSubject& subject, const HostLayout& host) {
  ConfinePolicy policy;
  const auto allow = [&policy](PathAccess access, const std::string& path) { policy.rules.push_back({access, path}); };
  for (const auto& path : host.systemDirectories) allow(PathAccess::readExecute, path);
  for (const auto& path : host.systemFiles) allow(PathAccess::read, path);
  if (hasNetwork(subject, host)) {
    for (const auto& path : host.networkFiles) allow(PathAccess::read, path);
  }
  allow(PathAccess::read, kProcesses);
  allow(PathAccess::read, kDescriptionPath);
  for (const char* path : kDevices) allow(PathAccess::device, path);
  allow(PathAccess::readWrite, kSharedMemory);
  allow(PathAccess::readWrite, kTemporary);
  allow(PathAccess::readExecute, subject.bundleDirectory);
  allow(PathAccess::readWrite, subject.container);
  for (const auto& path : subject.groups) allow(PathAccess::readWrite, path);
  if (subject.kind == LaunchKind::application) allow(PathAccess::read, subject.publicSockets);
  if (subject.kind == LaunchKind::extension) {
    policy.descriptors = kExtensionSocketNumber + 1;
    // Of a file that is leased to it a provider knows that nobody has it open, and may take its contents away.
    policy.leases = Leases::taken;
  }
  setLimits(policy, subject.kind, host);
  return policy;
}

std::vector<std::string> launchArguments(const LaunchSubject& subject, const HostLayout& host) {
  ConfineCommand inside{confinePolicy(subject, host), {subject.executable}};
  inside.command.insert(inside.command.end(), subject.arguments.begin(), subject.arguments.end());

  Arguments arguments;
  arguments.add(host.bubblewrap);
  addNamespaces(arguments, subject, host);
  addSystem(arguments, subject, host);
  addOwn(arguments, subject, host);
  arguments.add("--", kHelperPath);
  for (auto& word : confineArguments(inside)) arguments.add(std::move(word));
  return arguments.take();
}

}  // namespace docuvend::linux_platform
