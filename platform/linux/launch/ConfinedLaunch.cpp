#include "platform/linux/launch/ConfinedLaunch.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <memory>
#include <string_view>

#include "platform/linux/base/confinement.h"
#include "platform/linux/bundles/OwnDirectory.h"
#include "platform/linux/launch/HostLayout.h"
#include "platform/linux/launch/LaunchArguments.h"
#include "platform/linux/launch/LaunchDescription.h"
#include "platform/linux/launch/PrivatePlaces.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kDescriptionNumber = kExtensionSocketNumber + 1;
constexpr int kFirstInherited = 3;
constexpr const char* kProgramPath = "/usr/local/bin:/usr/bin:/bin";
constexpr const char* kTemporaryDirectory = "/tmp";
constexpr const char* kDefaultLanguage = "C.UTF-8";
constexpr std::size_t kLongestWord = 64;  // of LANG and TERM

using PathResult = std::variant<std::string, QXError>;

QXError failure(const std::string& what) { return QXError::system(errno, what); }

PathResult canonical(const std::string& path) {
  const std::unique_ptr<char, decltype(&std::free)> resolved(::realpath(path.c_str(), nullptr), &std::free);
  if (!resolved) return failure("cannot resolve " + path);
  return std::string(resolved.get());
}

// Everything the subject needs on disk; its paths are canonical then.
std::optional<QXError> prepareDirectories(const Bundle& bundle, const Paths& paths, LaunchSubject& subject) {
  const auto keep = [](PathResult result, std::string& place) -> std::optional<QXError> {
    if (auto* error = std::get_if<QXError>(&result)) return std::move(*error);
    place = std::get<std::string>(std::move(result));
    return std::nullopt;
  };
  if (auto error = keep(canonical(bundle.directory), subject.bundleDirectory)) return error;
  if (auto error = keep(canonical(bundle.executable), subject.executable)) return error;
  if (!subject.executable.starts_with(subject.bundleDirectory + "/")) {
    return QXError::system(EPERM, "the executable of " + bundle.identifier + " lies outside its bundle");
  }
  if (auto error = keep(makeOwnDirectory(bundle.container), subject.container)) return error;
  for (const auto& [group, directory] : bundle.groups) {
    if (auto error = keep(makeOwnDirectory(directory), subject.groups.emplace_back())) return error;
  }
  if (subject.kind == LaunchKind::extension) return std::nullopt;
  if (auto error = prepareRuntimeDirectories(paths)) return error;
  return keep(canonical(paths.publicSockets), subject.publicSockets);
}

std::variant<UniqueDescriptor, QXError> writeDescription(const Bundle& bundle, LaunchKind kind) {
  auto instance = newInstance();
  if (!instance) return failure("cannot get random bytes");
  const std::string text = descriptionText({bundle.identifier, bundle.incarnation, *instance, kind});
  UniqueDescriptor file(::memfd_create("docuvend-info", MFD_CLOEXEC));
  if (!file) return failure("cannot make the description");
  if (::write(file.get(), text.data(), text.size()) != static_cast<ssize_t>(text.size()) || ::lseek(file.get(), 0, SEEK_SET) != 0) {
    return failure("cannot write the description");
  }
  return file;
}

bool isPlainWord(std::string_view text) {
  return !text.empty() && text.size() <= kLongestWord && std::all_of(text.begin(), text.end(), [](char c) {
    return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') ||
           std::string_view("._@-+").find(c) != std::string_view::npos;
  });
}

std::vector<std::string> makeEnvironment(const LaunchSubject& subject) {
  std::vector<std::string> environment = {std::string("PATH=") + kProgramPath, "HOME=" + subject.container,
                                          std::string("TMPDIR=") + kTemporaryDirectory};
  const char* language = std::getenv("LANG");
  environment.push_back(std::string("LANG=") + (language != nullptr && isPlainWord(language) ? language : kDefaultLanguage));
  if (subject.kind == LaunchKind::extension) return environment;
  const std::string runtime = subject.publicSockets.substr(0, subject.publicSockets.rfind("/docuvend/public"));
  environment.push_back("XDG_RUNTIME_DIR=" + runtime);
  const char* terminal = std::getenv("TERM");
  if (terminal != nullptr && isPlainWord(terminal)) environment.push_back(std::string("TERM=") + terminal);
  return environment;
}

std::optional<QXError> checkHost(const HostLayout& host) {
  if (::geteuid() == 0) return QXError::system(EPERM, "root cannot be confined; run this as a user");
  if (host.landlockLevel < 1) return QXError::system(EOPNOTSUPP, "the kernel has no Landlock, or has it switched off");
  if (host.bubblewrap.empty()) return QXError::system(ENOENT, "bubblewrap is not installed");
  if (host.helper.empty()) return QXError::system(ENOENT, "docuvend-confine is not installed");
  return std::nullopt;
}

std::vector<char*> pointers(std::vector<std::string>& words) {
  std::vector<char*> result;
  result.reserve(words.size() + 1);
  for (auto& word : words) result.push_back(word.data());
  result.push_back(nullptr);
  return result;
}

}  // namespace

std::variant<LaunchPlan, QXError> planLaunch(const Bundle& bundle, const std::vector<std::string>& arguments, LaunchKind kind,
                                             std::optional<UniqueDescriptor> extensionSocket, const Paths& paths) {
  const HostLayout host = HostLayout::read();
  if (auto error = checkHost(host)) return *error;
  if (auto problem = exposedPlace(host, paths)) return QXError::system(EPERM, *std::move(problem));
  if (extensionSocket.has_value() != (kind == LaunchKind::extension)) {
    return QXError::system(EINVAL, "an extension, and only an extension, is given a socket");
  }
  LaunchSubject subject;
  subject.kind = kind;
  subject.arguments = arguments;
  subject.descriptionDescriptor = kDescriptionNumber;
  if (auto error = prepareDirectories(bundle, paths, subject)) return *error;
  auto description = writeDescription(bundle, kind);
  if (auto* error = std::get_if<QXError>(&description)) return *error;

  LaunchPlan plan;
  plan.arguments = launchArguments(subject, host);
  plan.environment = makeEnvironment(subject);
  if (extensionSocket) plan.inherited.push_back({kExtensionSocketNumber, std::move(*extensionSocket)});
  plan.inherited.push_back({kDescriptionNumber, std::get<UniqueDescriptor>(std::move(description))});
  return plan;
}

QXError execute(LaunchPlan plan) {
  // Out of the way of every number that is wanted, then each to its own.
  int firstFree = kFirstInherited;
  for (const auto& inherited : plan.inherited) firstFree = std::max(firstFree, inherited.number + 1);
  for (auto& inherited : plan.inherited) {
    UniqueDescriptor moved(::fcntl(inherited.descriptor.get(), F_DUPFD_CLOEXEC, firstFree));
    if (!moved) return failure("cannot pass a descriptor on");
    inherited.descriptor = std::move(moved);
  }
  if (::close_range(kFirstInherited, UINT_MAX, CLOSE_RANGE_CLOEXEC) != 0) return failure("cannot close the other descriptors");
  for (const auto& inherited : plan.inherited) {
    if (::dup2(inherited.descriptor.get(), inherited.number) < 0) return failure("cannot pass a descriptor on");
  }
  auto argumentPointers = pointers(plan.arguments);
  auto environmentPointers = pointers(plan.environment);
  ::execve(argumentPointers[0], argumentPointers.data(), environmentPointers.data());
  return failure("cannot execute " + plan.arguments[0]);
}

}  // namespace docuvend::linux_platform
