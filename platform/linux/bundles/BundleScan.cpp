#include "platform/linux/bundles/BundleScan.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "platform/linux/bundles/GroupMembership.h"
#include "platform/linux/bundles/OwnDirectory.h"

namespace docuvend::linux_platform {
namespace {

using Kind = DirectoryEntry::Kind;

// An installer works under such a name.
bool isHidden(const DirectoryEntry& entry) { return entry.name.starts_with('.'); }

TrustedOwner trustedOwnerOf(BundleOrigin origin) {
  return origin == BundleOrigin::system ? TrustedOwner::thisUserOrRoot : TrustedOwner::thisUser;
}

// What is not there is nobody's.
Seen<std::optional<std::string_view>> distrustAt(const std::string& path, BundleOrigin origin) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) == 0) return distrust(status, trustedOwnerOf(origin));
  if (!isAnswer(errno)) return notSeen(path, errno);
  return std::nullopt;
}

std::variant<ParsedBundle, BundleProblem, QXError> readTrusted(const std::string& directory, BundleOrigin origin,
                                                               QXPropertyLists& propertyLists) {
  auto parsed = parseBundle(directory, propertyLists);
  auto* const bundle = std::get_if<ParsedBundle>(&parsed);
  if (bundle == nullptr) return parsed;
  bundle->origin = origin;
  auto distrusted = distrustOf(*bundle);
  if (auto* error = std::get_if<QXError>(&distrusted)) return std::move(*error);
  if (auto& problem = std::get<std::optional<BundleProblem>>(distrusted)) return *std::move(problem);
  return parsed;
}

}  // namespace

Seen<std::optional<BundleProblem>> distrustOf(const ParsedBundle& parsed) {
  const std::string& directory = parsed.bundle.directory;
  std::vector<std::string> names = {"", "Info.plist", "Entitlements.plist"};
  const std::string executable = parsed.bundle.executable.substr(directory.size() + 1);
  for (std::size_t slash = executable.find('/'); slash != std::string::npos; slash = executable.find('/', slash + 1)) {
    names.push_back(executable.substr(0, slash));
  }
  names.push_back(executable);
  for (const std::string& name : names) {
    auto seen = distrustAt(name.empty() ? directory : directory + "/" + name, parsed.origin);
    if (auto* error = std::get_if<QXError>(&seen)) return std::move(*error);
    const auto& why = std::get<std::optional<std::string_view>>(seen);
    if (why) return BundleProblem{(name.empty() ? "it " : "its " + name + " ").append(*why)};
  }
  return std::nullopt;
}

Seen<std::vector<std::string>> bundleDirectories(const std::string& root) {
  auto real = realPath(root);
  if (auto* error = std::get_if<QXError>(&real)) return std::move(*error);
  const auto& directory = std::get<std::string>(real);
  auto entries = entriesOf(directory);
  if (auto* error = std::get_if<QXError>(&entries)) return std::move(*error);
  std::vector<std::string> result;
  for (const auto& entry : std::get<std::vector<DirectoryEntry>>(entries)) {
    if (entry.kind == Kind::directory && !isHidden(entry)) result.push_back(directory + "/" + entry.name);
  }
  return result;
}

Seen<std::vector<std::string>> directoriesOfBundle(const std::string& directory) {
  std::vector<std::string> result{directory};
  for (std::size_t next = 0; next < result.size() && result.size() < kMostBundleDirectories; ++next) {
    const std::string above = result[next];
    auto entries = entriesOf(above);
    if (auto* error = std::get_if<QXError>(&entries)) return std::move(*error);
    for (const auto& entry : std::get<std::vector<DirectoryEntry>>(entries)) {
      if (entry.kind == Kind::directory && result.size() < kMostBundleDirectories) result.push_back(above + "/" + entry.name);
    }
  }
  return result;
}

BundleLook BundleScan::run(const std::set<std::string>& unsettled) {
  lastFound_ = std::exchange(found_, {});
  reported_.clear();
  notSeen_.reset();
  const auto lastParsed = std::exchange(parsed_, {});
  scanDirectory(paths_.systemBundles, BundleOrigin::system, unsettled, lastParsed);
  scanDirectory(paths_.userBundles, BundleOrigin::user, unsettled, lastParsed);
  BundleLook result{resolve(), {}};
  result.notSeen = notSeen_;
  if (notSeen_) reported_.merge(lastReported_);  // for all that is known it is still so
  lastReported_ = std::move(reported_);
  return result;
}

void BundleScan::scanDirectory(const std::string& root, BundleOrigin origin, const std::set<std::string>& unsettled,
                               const Parsed& lastParsed) {
  const auto missedAll = [this, origin, &lastParsed](const QXError& error) {
    missed(error);
    for (const auto& [directory, last] : lastParsed) {
      if (last.origin == origin) keep(last);
    }
  };
  const auto place = realPath(root);
  if (const auto* error = std::get_if<QXError>(&place)) return missedAll(*error);
  const auto& real = std::get<std::string>(place);
  const auto distrusted = distrustAt(real, origin);
  if (const auto* error = std::get_if<QXError>(&distrusted)) return missedAll(*error);
  if (const auto& why = std::get<std::optional<std::string_view>>(distrusted)) {
    report(qxLogMessage("[ERROR] Ignoring the bundles in %@: it %@.", real, *why));
    return;
  }
  const auto entries = entriesOf(real);
  if (const auto* error = std::get_if<QXError>(&entries)) return missedAll(*error);
  for (const auto& entry : std::get<std::vector<DirectoryEntry>>(entries)) {
    if (isHidden(entry)) continue;
    const std::string path = real + "/" + entry.name;
    if (entry.kind == Kind::link) report(qxLogMessage("[ERROR] Ignoring the bundle at %@: it is a link.", path));
    if (entry.kind != Kind::directory) continue;
    if (!unsettled.contains(path)) {
      scanBundle(path, origin, lastParsed);
    } else if (const auto last = lastParsed.find(path); last != lastParsed.end()) {
      add(last->second);
    }
  }
}

void BundleScan::scanBundle(const std::string& directory, BundleOrigin origin, const Parsed& lastParsed) {
  const auto last = lastParsed.find(directory);
  const auto reading = readTrusted(directory, origin, propertyLists_);
  if (const auto* problem = std::get_if<BundleProblem>(&reading)) return ignore(directory, *problem);
  if (const auto* error = std::get_if<QXError>(&reading)) {
    missed(*error);
    if (last != lastParsed.end()) keep(last->second);
    return;
  }
  add(std::get<ParsedBundle>(reading));
}

// As it was, if this very directory is still there and still nobody else's. Otherwise it is no bundle until it is read, but what was there
// stays known: a look that then passes over its update as unsettled would let another have its identifier.
void BundleScan::keep(const ParsedBundle& last) {
  const auto there = incarnationOf(last.bundle.directory);
  if (const auto* incarnation = std::get_if<std::string>(&there); incarnation != nullptr && *incarnation != last.bundle.incarnation) {
    parsed_.insert_or_assign(last.bundle.directory, last);
    return;
  }
  const auto distrusted = distrustOf(last);
  if (const auto* problem = std::get_if<std::optional<BundleProblem>>(&distrusted); problem != nullptr && *problem) {
    return ignore(last.bundle.directory, **problem);
  }
  add(last);
}

void BundleScan::add(const ParsedBundle& parsed) {
  parsed_.insert_or_assign(parsed.bundle.directory, parsed);
  if (notSeen_ && !wasFound(parsed.bundle)) return;
  const auto same = std::find_if(found_.begin(), found_.end(),
                                 [&parsed](const ParsedBundle& other) { return other.bundle.identifier == parsed.bundle.identifier; });
  if (same == found_.end()) {
    found_.push_back(parsed);
    return;
  }
  report(qxLogMessage("[ERROR] Ignoring the bundle at %@: %@ has the same identifier.", parsed.bundle.directory, same->bundle.directory));
}

bool BundleScan::wasFound(const Bundle& bundle) const {
  return std::any_of(lastFound_.begin(), lastFound_.end(), [&bundle](const ParsedBundle& last) {
    return last.bundle.identifier == bundle.identifier && last.bundle.directory == bundle.directory &&
           last.bundle.incarnation == bundle.incarnation;
  });
}

BundleMap BundleScan::resolve() {
  const std::string containers = placeOf(paths_.containers);
  const std::string groupContainers = placeOf(paths_.groupContainers);
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

std::string BundleScan::placeOf(const std::string& path) {
  const auto real = realPath(path);
  if (const auto* error = std::get_if<QXError>(&real)) {
    missed(*error);
  } else {
    places_.insert_or_assign(path, std::get<std::string>(real));
  }
  const auto last = places_.find(path);
  return last == places_.end() ? path : last->second;
}

void BundleScan::missed(const QXError& error) {
  if (!notSeen_) notSeen_ = error;
}

void BundleScan::ignore(const std::string& directory, const BundleProblem& problem) {
  report(qxLogMessage("[ERROR] Ignoring the bundle at %@: %@.", directory, problem.text));
}

void BundleScan::report(const QXLogMessage& message) {
  if (reported_.insert(message.text).second && !lastReported_.contains(message.text)) qxLog(log_, message);
}

}  // namespace docuvend::linux_platform
