#include "platform/linux/launch/HostLayout.h"

#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <system_error>

#include "platform/linux/launch/policy/Landlock.h"

namespace docuvend::linux_platform {
namespace {

constexpr const char* kBubblewrap = "/usr/bin/bwrap";
constexpr const char* kHelperName = "docuvend-confine";
constexpr const char* kHelperDirectory = "../libexec/docuvend";  // from the directory of the programs
constexpr std::array kSystemRoots = {"/usr", "/bin", "/sbin", "/lib", "/lib32", "/lib64", "/libx32"};
constexpr std::array kSystemFiles = {"/etc/alternatives", "/etc/ca-certificates", "/etc/group",  "/etc/ld.so.cache",
                                     "/etc/localtime",    "/etc/nsswitch.conf",   "/etc/passwd", "/etc/ssl/certs",
                                     "/etc/timezone",     "/etc/ssl/openssl.cnf"};
constexpr std::array kNetworkFiles = {"/etc/gai.conf",  "/etc/host.conf",   "/etc/hosts",
                                      "/etc/protocols", "/etc/resolv.conf", "/etc/services"};

// Beside this program, or where the installation puts helpers. Nothing of the environment has a say.
std::string findHelper() {
  std::error_code error;
  const auto program = std::filesystem::read_symlink("/proc/self/exe", error);
  if (error) return {};
  const auto directory = program.parent_path();
  for (const auto& candidate : {directory / kHelperName, (directory / kHelperDirectory / kHelperName).lexically_normal()}) {
    if (::access(candidate.c_str(), X_OK) == 0) return candidate;
  }
  return {};
}

template <std::size_t N>
std::vector<std::string> existing(const std::array<const char*, N>& paths) {
  std::vector<std::string> result;
  for (const char* path : paths) {
    if (::access(path, R_OK) == 0) result.emplace_back(path);
  }
  return result;
}

std::optional<std::uint64_t> limitOn(__rlimit_resource resource, rlim_t rlimit::*which) {
  rlimit limit{};
  if (::getrlimit(resource, &limit) != 0 || limit.*which == RLIM_INFINITY) return std::nullopt;
  return limit.*which;
}

std::filesystem::path withoutLinks(const std::string& path) {
  std::error_code error;
  const auto real = std::filesystem::weakly_canonical(path, error);
  return error ? std::filesystem::path(path).lexically_normal() : real;
}

bool isAtOrBelow(const std::filesystem::path& directory, const std::filesystem::path& path) {
  return std::mismatch(directory.begin(), directory.end(), path.begin(), path.end()).first == directory.end();
}

}  // namespace

HostLayout HostLayout::read() {
  HostLayout layout;
  for (const char* path : kSystemRoots) {
    struct stat status {};
    if (::lstat(path, &status) != 0) continue;
    std::error_code error;
    if (S_ISLNK(status.st_mode)) {
      layout.systemLinks.emplace_back(path, std::filesystem::read_symlink(path, error).string());
    } else if (S_ISDIR(status.st_mode)) {
      layout.systemDirectories.emplace_back(path);
    }
  }
  layout.systemFiles = existing(kSystemFiles);
  layout.networkFiles = existing(kNetworkFiles);
  layout.processes = limitOn(RLIMIT_NPROC, &rlimit::rlim_cur);
  layout.openFiles = limitOn(RLIMIT_NOFILE, &rlimit::rlim_max);  // the daemon raises its own to this
  layout.pendingSignals = limitOn(RLIMIT_SIGPENDING, &rlimit::rlim_cur);
  layout.lockedMemory = limitOn(RLIMIT_MEMLOCK, &rlimit::rlim_cur);
  layout.landlockLevel = docuvend::linux_platform::landlockLevel();
  if (::access(kBubblewrap, X_OK) == 0) layout.bubblewrap = kBubblewrap;
  layout.helper = findHelper();
  return layout;
}

std::optional<std::string> HostLayout::shownAround(const std::string& path) const {
  const auto real = withoutLinks(path);
  for (const auto* shown : {&systemDirectories, &systemFiles, &networkFiles}) {
    for (const std::string& place : *shown) {
      if (isAtOrBelow(withoutLinks(place), real)) return place;
    }
  }
  return std::nullopt;
}

}  // namespace docuvend::linux_platform
