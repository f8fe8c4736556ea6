// Rights are handled as far as the kernel's level knows them: asking for an unknown one is refused as a whole. What an older level does
// not handle (truncation below 3, device controls below 5, scopes below 6) is not taken away by Landlock; the read-only mount namespace
// around it still takes truncation.
#include "platform/linux/launch/policy/Landlock.h"

#include <fcntl.h>
#include <linux/landlock.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/base/kernel.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kReferLevel = 2;

constexpr std::uint64_t kRead = LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_READ_DIR;
constexpr std::uint64_t kWriteFile = LANDLOCK_ACCESS_FS_WRITE_FILE | kernel::kLandlockTruncate;
constexpr std::uint64_t kChangeDirectory = LANDLOCK_ACCESS_FS_REMOVE_DIR | LANDLOCK_ACCESS_FS_REMOVE_FILE | LANDLOCK_ACCESS_FS_MAKE_DIR |
                                           LANDLOCK_ACCESS_FS_MAKE_REG | LANDLOCK_ACCESS_FS_MAKE_SOCK | LANDLOCK_ACCESS_FS_MAKE_FIFO |
                                           LANDLOCK_ACCESS_FS_MAKE_SYM | LANDLOCK_ACCESS_FS_REFER;
constexpr std::uint64_t kMakeDevice = LANDLOCK_ACCESS_FS_MAKE_CHAR | LANDLOCK_ACCESS_FS_MAKE_BLOCK;
constexpr std::uint64_t kEverything =
    LANDLOCK_ACCESS_FS_EXECUTE | kRead | kWriteFile | kChangeDirectory | kMakeDevice | kernel::kLandlockIoctlDevice;
// What a rule on something that is not a directory may name.
constexpr std::uint64_t kFileRights = LANDLOCK_ACCESS_FS_EXECUTE | LANDLOCK_ACCESS_FS_READ_FILE | kWriteFile | kernel::kLandlockIoctlDevice;

std::uint64_t knownAt(int level) {
  std::uint64_t rights = kEverything;
  if (level < kReferLevel) rights &= ~std::uint64_t{LANDLOCK_ACCESS_FS_REFER};
  if (level < kLandlockTruncateLevel) rights &= ~kernel::kLandlockTruncate;
  if (level < kLandlockDevicesLevel) rights &= ~kernel::kLandlockIoctlDevice;
  return rights;
}

std::uint64_t rightsFor(PathAccess access) {
  switch (access) {
    case PathAccess::readExecute:
      return kRead | LANDLOCK_ACCESS_FS_EXECUTE;
    case PathAccess::read:
      return kRead;
    case PathAccess::readWrite:
      return kRead | kWriteFile | kChangeDirectory;
    case PathAccess::device:
      return LANDLOCK_ACCESS_FS_READ_FILE | kWriteFile;
  }
  return 0;
}

QXError failure(const std::string& what) { return QXError::system(errno, what); }

std::optional<QXError> addRule(int ruleset, const ConfinePolicy::Rule& rule, std::uint64_t handled) {
  const UniqueDescriptor object(::open(rule.path.c_str(), O_PATH | O_CLOEXEC));
  struct stat status {};
  if (!object || ::fstat(object.get(), &status) != 0) return failure("cannot open " + rule.path);
  landlock_path_beneath_attr attribute{};
  attribute.allowed_access = rightsFor(rule.access) & handled & (S_ISDIR(status.st_mode) ? kEverything : kFileRights);
  attribute.parent_fd = object.get();
  if (::syscall(SYS_landlock_add_rule, ruleset, LANDLOCK_RULE_PATH_BENEATH, &attribute, 0) != 0) {
    return failure("cannot add the rule for " + rule.path);
  }
  return std::nullopt;
}

}  // namespace

int landlockLevel() {
  const long level = ::syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION);
  return level > 0 ? static_cast<int>(level) : 0;
}

std::optional<QXError> restrictToRules(const std::vector<ConfinePolicy::Rule>& rules, int level) {
  if (level < 1) return QXError::system(EOPNOTSUPP, "the kernel has no Landlock");
  kernel::LandlockRulesetAttribute attribute;
  attribute.handledAccessFileSystem = knownAt(level);
  if (level >= kLandlockScopesLevel) attribute.scoped = kernel::kLandlockScopeAbstractUnixSocket | kernel::kLandlockScopeSignal;
  const UniqueDescriptor ruleset(static_cast<int>(::syscall(SYS_landlock_create_ruleset, &attribute, sizeof(attribute), 0)));
  if (!ruleset) return failure("cannot create a Landlock ruleset");
  for (const auto& rule : rules) {
    if (auto error = addRule(ruleset.get(), rule, attribute.handledAccessFileSystem)) return error;
  }
  if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return failure("cannot give up gaining privileges");
  if (::syscall(SYS_landlock_restrict_self, ruleset.get(), 0) != 0) return failure("cannot enter the Landlock ruleset");
  return std::nullopt;
}

}  // namespace docuvend::linux_platform
