// Of the copies of one identifier that the user's directory may hold, put there by other means, the registry takes the first by name. That
// one is exchanged or removed; the others go too, or one of them would come to light. They go first when a bundle is removed, and last
// when it is updated, so that whoever looks in between never sees an older copy than the one that counted.
#include "platform/linux/bundles/BundleInstaller.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>
#include <utility>
#include <vector>

#include "platform/linux/bundles/BundleCopy.h"
#include "platform/linux/bundles/BundleErrors.h"
#include "platform/linux/bundles/BundleIdentifier.h"
#include "platform/linux/bundles/BundleParser.h"
#include "platform/linux/bundles/BundleScan.h"
#include "platform/linux/bundles/GroupMembership.h"
#include "platform/linux/bundles/Seen.h"
#include "platform/linux/bundles/UserBundleDirectory.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;
using Sound = std::variant<ParsedBundle, QXError>;

std::string nameOf(const std::string& path) { return fs::path(path).filename().string(); }

// The bundle that lies there.
Sound examine(const std::string& directory, const std::string& shownAs, QXPropertyLists& propertyLists) {
  auto parsed = parseBundle(directory, propertyLists);
  if (const auto* problem = std::get_if<BundleProblem>(&parsed)) {
    return bundleError(BundleErrorCode::noBundle, shownAs + " is no bundle: " + problem->text + ".");
  }
  if (auto* error = std::get_if<QXError>(&parsed)) return std::move(*error);
  return std::get<ParsedBundle>(std::move(parsed));
}

// The names of the directories of `root` that hold a bundle of that identifier, the one that counts first.
Seen<std::vector<std::string>> copiesOf(const std::string& identifier, const std::string& root, QXPropertyLists& propertyLists) {
  std::vector<std::string> result;
  auto directories = bundleDirectories(root);
  if (auto* error = std::get_if<QXError>(&directories)) return std::move(*error);
  for (const std::string& directory : std::get<std::vector<std::string>>(directories)) {
    auto parsed = parseBundle(directory, propertyLists);
    if (auto* error = std::get_if<QXError>(&parsed)) return std::move(*error);
    const auto* bundle = std::get_if<ParsedBundle>(&parsed);
    if (bundle != nullptr && bundle->bundle.identifier == identifier) result.push_back(nameOf(directory));
  }
  return result;
}

std::optional<QXError> refuseTheSystems(const std::string& identifier, const Paths& paths, QXPropertyLists& propertyLists) {
  auto copies = copiesOf(identifier, paths.systemBundles, propertyLists);
  if (auto* error = std::get_if<QXError>(&copies)) return std::move(*error);
  if (std::get<std::vector<std::string>>(copies).empty()) return std::nullopt;
  return bundleError(BundleErrorCode::notPermitted, "The bundle " + identifier + " is the system's; only the system changes it.");
}

// What would be installed beside the bundle, as the registry would take it.
Seen<std::vector<ParsedBundle>> bundlesWith(const ParsedBundle& bundle, const Paths& paths, QXPropertyLists& propertyLists) {
  std::vector<ParsedBundle> result{bundle};
  for (const auto& [root, origin] :
       {std::pair(paths.systemBundles, BundleOrigin::system), std::pair(paths.userBundles, BundleOrigin::user)}) {
    auto directories = bundleDirectories(root);
    if (auto* error = std::get_if<QXError>(&directories)) return std::move(*error);
    for (const std::string& directory : std::get<std::vector<std::string>>(directories)) {
      auto parsed = parseBundle(directory, propertyLists);
      if (auto* error = std::get_if<QXError>(&parsed)) return std::move(*error);
      auto* other = std::get_if<ParsedBundle>(&parsed);
      if (other == nullptr) continue;
      other->origin = origin;
      const bool isNew = std::none_of(result.begin(), result.end(),
                                      [other](const ParsedBundle& known) { return known.bundle.identifier == other->bundle.identifier; });
      if (!isNew) continue;
      auto distrusted = distrustOf(*other);
      if (auto* error = std::get_if<QXError>(&distrusted)) return std::move(*error);
      if (!std::get<std::optional<BundleProblem>>(distrusted)) result.push_back(std::move(*other));
    }
  }
  return result;
}

std::optional<QXError> refuseWhatIsAnothers(const ParsedBundle& bundle, const Paths& paths, QXPropertyLists& propertyLists) {
  auto bundles = bundlesWith(bundle, paths, propertyLists);
  if (auto* error = std::get_if<QXError>(&bundles)) return std::move(*error);
  const GroupMembership membership(std::get<std::vector<ParsedBundle>>(bundles));
  const std::string& identifier = bundle.bundle.identifier;
  for (const std::string& group : bundle.wantedGroups) {
    const auto refusal = membership.refusal(identifier, group);
    // The bundle may wait for the owner.
    if (!refusal || refusal->reason == GroupMembership::Refusal::Reason::ownerIsMissing) continue;
    return bundleError(BundleErrorCode::notItsOwn,
                       "The bundle " + identifier + " may not belong to the group " + group + ", " + refusal->whose + ".");
  }
  const auto lists = GroupMembership::foreignLists(bundle);
  if (lists.empty()) return std::nullopt;
  return bundleError(BundleErrorCode::notItsOwn, "The bundle " + identifier + " may not name members of the group " + lists.front().group +
                                                     ", " + lists.front().whose + ".");
}

// A bundle's copy under a hidden name, and whatever else has taken that name; gone with the object.
class HiddenCopy {
 public:
  HiddenCopy(const UserBundleDirectory& place, std::string name) : place_(place), name_(std::move(name)) {}
  HiddenCopy(const HiddenCopy&) = delete;
  HiddenCopy& operator=(const HiddenCopy&) = delete;
  ~HiddenCopy() { place_.removeHidden(name_); }

  [[nodiscard]] const std::string& name() const { return name_; }

  [[nodiscard]] std::optional<QXError> fill(const std::string& source) const {
    const UniqueDescriptor from(::open(source.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!from) return QXError::system(errno, "cannot open " + source);
    if (::mkdirat(place_.descriptor(), name_.c_str(), S_IRWXU) != 0) return QXError::system(errno, "cannot write into " + place_.path());
    const UniqueDescriptor to(::openat(place_.descriptor(), name_.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!to) return QXError::system(errno, "cannot write into " + place_.path());
    return copyBundle(from, to);
  }

 private:
  const UserBundleDirectory& place_;
  const std::string name_;
};

// Moves a directory out of sight and removes it.
std::optional<QXError> removeCopy(const UserBundleDirectory& place, const std::string& name) {
  auto hidden = place.hiddenName();
  if (auto* error = std::get_if<QXError>(&hidden)) return std::move(*error);
  const HiddenCopy out(place, std::get<std::string>(std::move(hidden)));
  return place.rename(name, out.name());
}

enum class Occupant { none, brokenBundle };

// The property lists of the bundle that lies at an identifier's name. A process that can read them, the bundle's own extension for one, may
// have a lease on them, which keeps everybody else from opening them. What is open to this object is leased to nobody while it is there.
class HeldLists {
 public:
  HeldLists(const UserBundleDirectory& place, const std::string& identifier) {
    if (!isBundleIdentifier(identifier)) return;
    for (const char* name : {"/Info.plist", "/Entitlements.plist"}) {
      const std::string path = identifier + name;
      UniqueDescriptor list(::openat(place.descriptor(), path.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_NOFOLLOW | O_CLOEXEC));
      areLeased_ = areLeased_ || (!list && errno == EWOULDBLOCK);
      lists_.push_back(std::move(list));
    }
  }

  [[nodiscard]] bool areLeased() const { return areLeased_; }

 private:
  std::vector<UniqueDescriptor> lists_;
  bool areLeased_ = false;
};

// What lies at the bundle's own name without being one of its copies, put there by other means. A broken bundle is replaced, anything that
// means something stays.
std::variant<Occupant, QXError> occupantOf(const std::string& path, QXPropertyLists& propertyLists) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) {
    if (errno == ENOENT) return Occupant::none;
    return notSeen(path, errno);
  }
  if (S_ISDIR(status.st_mode)) {
    auto parsed = parseBundle(path, propertyLists);
    if (std::holds_alternative<BundleProblem>(parsed)) return Occupant::brokenBundle;
    if (auto* error = std::get_if<QXError>(&parsed)) return std::move(*error);
  }
  return bundleError(BundleErrorCode::inTheWay, path + " is in the way.");
}

}  // namespace

std::variant<InstalledBundle, QXError> installBundle(const std::string& directory, const Paths& paths, QXPropertyLists& propertyLists) {
  std::error_code error;
  const fs::path source = fs::canonical(directory, error);
  if (error && !isAnswer(error.value())) return notSeen(directory, error.value());
  if (error) return bundleError(BundleErrorCode::noBundle, directory + " cannot be opened: " + error.message() + ".");
  // What can be refused at once is not copied first. What counts is the copy.
  auto examined = examine(source.string(), directory, propertyLists);
  if (auto* refusal = std::get_if<QXError>(&examined)) return std::move(*refusal);

  auto opened = UserBundleDirectory::open(paths, UserBundleDirectory::Absence::isMended);
  if (auto* failure = std::get_if<QXError>(&opened)) return std::move(*failure);
  const auto& place = std::get<UserBundleDirectory>(opened);
  auto hidden = place.hiddenName();
  if (auto* failure = std::get_if<QXError>(&hidden)) return std::move(*failure);
  const HiddenCopy copy(place, std::get<std::string>(std::move(hidden)));
  if (auto failure = copy.fill(source.string())) return *std::move(failure);
  examined = examine(place.path() + "/" + copy.name(), directory, propertyLists);
  if (auto* refusal = std::get_if<QXError>(&examined)) return std::move(*refusal);

  const auto& bundle = std::get<ParsedBundle>(examined);
  const std::string& identifier = bundle.bundle.identifier;
  if (auto refusal = refuseTheSystems(identifier, paths, propertyLists)) return *std::move(refusal);
  if (auto refusal = refuseWhatIsAnothers(bundle, paths, propertyLists)) return *std::move(refusal);
  auto found = copiesOf(identifier, place.path(), propertyLists);
  if (auto* failure = std::get_if<QXError>(&found)) return std::move(*failure);
  const auto& older = std::get<std::vector<std::string>>(found);
  if (older.empty()) {
    const auto occupant = occupantOf(place.path() + "/" + identifier, propertyLists);
    if (const auto* refusal = std::get_if<QXError>(&occupant)) return *refusal;
    const bool isFree = std::get<Occupant>(occupant) == Occupant::none;
    auto failure = isFree ? place.rename(copy.name(), identifier) : place.exchange(copy.name(), identifier);
    if (failure) return *std::move(failure);
    return InstalledBundle{identifier, place.path() + "/" + identifier, InstalledBundle::Outcome::installed};
  }
  if (auto failure = place.exchange(copy.name(), older.front())) return *std::move(failure);
  for (std::size_t i = 1; i < older.size(); ++i) {
    if (auto failure = removeCopy(place, older[i])) return *std::move(failure);
  }
  return InstalledBundle{identifier, place.path() + "/" + older.front(), InstalledBundle::Outcome::updated};
}

std::optional<QXError> uninstallBundle(const std::string& identifier, const Paths& paths, QXPropertyLists& propertyLists) {
  if (auto refusal = refuseTheSystems(identifier, paths, propertyLists)) return refusal;
  const QXError unknown = bundleError(BundleErrorCode::notFound, "No bundle " + identifier + " is installed.");
  struct stat status {};
  if (::stat(paths.userBundles.c_str(), &status) != 0) return isAnswer(errno) ? unknown : notSeen(paths.userBundles, errno);
  auto opened = UserBundleDirectory::open(paths, UserBundleDirectory::Absence::isAnError);
  if (auto* failure = std::get_if<QXError>(&opened)) return std::move(*failure);
  const auto& place = std::get<UserBundleDirectory>(opened);
  const HeldLists lists(place, identifier);
  auto found = copiesOf(identifier, place.path(), propertyLists);
  if (auto* failure = std::get_if<QXError>(&found)) return std::move(*failure);
  auto& copies = std::get<std::vector<std::string>>(found);
  const bool isNamed = std::find(copies.begin(), copies.end(), identifier) != copies.end();
  if (lists.areLeased() && !isNamed) copies.push_back(identifier);
  if (copies.empty()) return unknown;
  std::reverse(copies.begin(), copies.end());
  for (const std::string& name : copies) {
    if (auto failure = removeCopy(place, name)) return failure;
  }
  return std::nullopt;
}

}  // namespace docuvend::linux_platform
