#include "platform/linux/bundles/BundleScan.h"

#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <system_error>
#include <utility>

#include "platform/linux/bundles/GroupMembership.h"
#include "platform/linux/bundles/OwnDirectory.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;

std::vector<fs::path> visibleEntries(const std::string& root) {
  std::vector<fs::path> result;
  std::error_code error;
  const fs::path real = fs::canonical(root, error);
  if (error) return result;
  for (fs::directory_iterator entry(real, error), end; !error && entry != end; entry.increment(error)) {
    if (!entry->path().filename().native().starts_with('.')) result.push_back(entry->path());
  }
  std::sort(result.begin(), result.end());
  return result;
}

// The real path of something that may not exist yet.
std::string realPath(const std::string& path) {
  std::error_code error;
  const fs::path real = fs::weakly_canonical(path, error);
  return error ? path : real.string();
}

TrustedOwner trustedOwnerOf(BundleOrigin origin) {
  return origin == BundleOrigin::system ? TrustedOwner::thisUserOrRoot : TrustedOwner::thisUser;
}

// What is not there is nobody's.
std::optional<std::string_view> distrustAt(const std::string& path, BundleOrigin origin) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return std::nullopt;
  return distrust(status, trustedOwnerOf(origin));
}

}  // namespace

std::optional<BundleProblem> distrustOf(const ParsedBundle& parsed) {
  const std::string& directory = parsed.bundle.directory;
  if (const auto why = distrustAt(directory, parsed.origin)) return BundleProblem{"it " + std::string(*why)};
  std::vector<std::string> names = {"Info.plist", "Entitlements.plist"};
  const std::string executable = parsed.bundle.executable.substr(directory.size() + 1);
  for (std::size_t slash = executable.find('/'); slash != std::string::npos; slash = executable.find('/', slash + 1)) {
    names.push_back(executable.substr(0, slash));
  }
  names.push_back(executable);
  for (const std::string& name : names) {
    if (const auto why = distrustAt(directory + "/" + name, parsed.origin)) return BundleProblem{"its " + name + " " + std::string(*why)};
  }
  return std::nullopt;
}

std::vector<std::string> bundleDirectories(const std::string& root) {
  std::vector<std::string> result;
  for (const auto& path : visibleEntries(root)) {
    std::error_code error;
    if (fs::symlink_status(path, error).type() == fs::file_type::directory) result.push_back(path.string());
  }
  return result;
}

std::vector<std::string> directoriesOfBundle(const std::string& directory) {
  std::vector<std::string> result{directory};
  for (std::size_t next = 0; next < result.size() && result.size() < kMostBundleDirectories; ++next) {
    std::error_code error;
    std::vector<std::string> below;
    for (fs::directory_iterator entry(result[next], error), end; !error && entry != end; entry.increment(error)) {
      std::error_code unknown;
      if (entry->symlink_status(unknown).type() == fs::file_type::directory) below.push_back(entry->path().string());
    }
    std::sort(below.begin(), below.end());
    below.resize(std::min(below.size(), kMostBundleDirectories - result.size()));
    result.insert(result.end(), below.begin(), below.end());
  }
  return result;
}

BundleMap BundleScan::run(const std::set<std::string>& unsettled) {
  found_.clear();
  reported_.clear();
  const auto lastParsed = std::exchange(parsed_, {});
  scanDirectory(paths_.systemBundles, BundleOrigin::system, unsettled, lastParsed);
  scanDirectory(paths_.userBundles, BundleOrigin::user, unsettled, lastParsed);
  BundleMap result = resolve();
  lastReported_ = std::move(reported_);
  return result;
}

void BundleScan::scanDirectory(const std::string& root, BundleOrigin origin, const std::set<std::string>& unsettled,
                               const Parsed& lastParsed) {
  const std::string real = realPath(root);
  if (const auto why = distrustAt(real, origin)) {
    report(qxLogMessage("[ERROR] Ignoring the bundles in %@: it %@.", real, *why));
    return;
  }
  for (const auto& path : visibleEntries(root)) {
    std::error_code error;
    const auto type = fs::symlink_status(path, error).type();
    if (type == fs::file_type::symlink) {
      report(qxLogMessage("[ERROR] Ignoring the bundle at %@: it is a link.", path.string()));
    }
    if (type != fs::file_type::directory) continue;
    if (unsettled.contains(path.string())) {
      if (const auto last = lastParsed.find(path.string()); last != lastParsed.end()) add(last->second);
      continue;
    }
    auto parsed = parseBundle(path.string(), propertyLists_);
    std::optional<BundleProblem> problem;
    if (auto* bundle = std::get_if<ParsedBundle>(&parsed)) {
      bundle->origin = origin;
      problem = distrustOf(*bundle);
    } else {
      problem = std::get<BundleProblem>(std::move(parsed));
    }
    if (problem) {
      report(qxLogMessage("[ERROR] Ignoring the bundle at %@: %@.", path.string(), problem->text));
    } else {
      add(std::get<ParsedBundle>(parsed));
    }
  }
}

void BundleScan::add(const ParsedBundle& parsed) {
  parsed_.insert_or_assign(parsed.bundle.directory, parsed);
  const auto same = std::find_if(found_.begin(), found_.end(),
                                 [&parsed](const ParsedBundle& other) { return other.bundle.identifier == parsed.bundle.identifier; });
  if (same == found_.end()) {
    found_.push_back(parsed);
    return;
  }
  report(qxLogMessage("[ERROR] Ignoring the bundle at %@: %@ has the same identifier.", parsed.bundle.directory, same->bundle.directory));
}

BundleMap BundleScan::resolve() {
  const std::string containers = realPath(paths_.containers);
  const std::string groupContainers = realPath(paths_.groupContainers);
  const GroupMembership membership(found_);
  BundleMap result;
  for (const auto& parsed : found_) {
    Bundle bundle = parsed.bundle;
    bundle.container = containers + "/" + bundle.identifier;
    for (const auto& group : parsed.wantedGroups) {
      if (const auto refusal = membership.refusal(bundle.identifier, group)) {
        report(qxLogMessage("[ERROR] The bundle %@ may not belong to the group %@, %@.", bundle.identifier, group, refusal->whose));
        continue;
      }
      if (bundle.groups.try_emplace(group, groupContainers + "/" + group).second) bundle.version += "/" + group;
    }
    for (const auto& [group, whose] : GroupMembership::foreignLists(parsed)) {
      report(qxLogMessage("[ERROR] The bundle %@ may not name members of the group %@, %@.", bundle.identifier, group, whose));
    }
    result.emplace(bundle.identifier, std::move(bundle));
  }
  return result;
}

void BundleScan::report(const QXLogMessage& message) {
  if (reported_.insert(message.text).second && !lastReported_.contains(message.text)) qxLog(log_, message);
}

}  // namespace docuvend::linux_platform
