#include "platform/linux/bundles/BundleScan.h"

#include <algorithm>
#include <filesystem>
#include <system_error>

#include "platform/linux/bundles/GroupMembership.h"

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

}  // namespace

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
  scanDirectory(paths_.systemBundles, unsettled, lastParsed);
  scanDirectory(paths_.userBundles, unsettled, lastParsed);
  BundleMap result = resolve();
  lastReported_ = std::move(reported_);
  return result;
}

void BundleScan::scanDirectory(const std::string& root, const std::set<std::string>& unsettled, const Parsed& lastParsed) {
  for (const auto& path : visibleEntries(root)) {
    std::error_code error;
    const auto type = fs::symlink_status(path, error).type();
    if (type == fs::file_type::symlink) {
      report("[ERROR] Ignoring the bundle at " + path.string() + ": it is a link.");
    }
    if (type != fs::file_type::directory) continue;
    if (unsettled.contains(path.string())) {
      if (const auto last = lastParsed.find(path.string()); last != lastParsed.end()) add(last->second);
      continue;
    }
    auto parsed = parseBundle(path.string(), propertyLists_);
    if (const auto* problem = std::get_if<BundleProblem>(&parsed)) {
      report("[ERROR] Ignoring the bundle at " + path.string() + ": " + problem->text + ".");
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
  report("[ERROR] Ignoring the bundle at " + parsed.bundle.directory + ": " + same->bundle.directory + " has the same identifier.");
}

BundleMap BundleScan::resolve() {
  const std::string containers = realPath(paths_.containers);
  const std::string groupContainers = realPath(paths_.groupContainers);
  BundleMap result;
  for (const auto& parsed : found_) {
    Bundle bundle = parsed.bundle;
    bundle.container = containers + "/" + bundle.identifier;
    for (const auto& group : parsed.wantedGroups) {
      if (mayBelongToGroup(bundle.identifier, group, found_)) {
        if (bundle.groups.try_emplace(group, groupContainers + "/" + group).second) bundle.version += "/" + group;
      } else {
        report("[ERROR] The bundle " + bundle.identifier + " may not belong to the group " + group + ".");
      }
    }
    result.emplace(bundle.identifier, std::move(bundle));
  }
  return result;
}

void BundleScan::report(const std::string& text) {
  if (reported_.insert(text).second && !lastReported_.contains(text) && log_.isEnabled(QXLogType::fault)) {
    log_.write(QXLogType::fault, text);
  }
}

}  // namespace docuvend::linux_platform
