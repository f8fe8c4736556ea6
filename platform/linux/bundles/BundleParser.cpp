#include "platform/linux/bundles/BundleParser.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <initializer_list>
#include <optional>
#include <string_view>
#include <system_error>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/bundles/BundleIdentifier.h"
#include "platform/linux/bundles/OpenInBundle.h"

namespace docuvend::linux_platform {
namespace {

constexpr const char* kInfoName = "Info.plist";
constexpr const char* kEntitlementsName = "Entitlements.plist";
constexpr std::string_view kIdentifierKey = "QXBundleIdentifier";
constexpr std::string_view kExecutableKey = "QXBundleExecutable";
constexpr std::string_view kGroupsKey = "QXGroups";
constexpr std::string_view kGroupMembersKey = "QXGroupMembers";
constexpr mode_t kExecutableBits = S_IXUSR | S_IXGRP | S_IXOTH;

enum class Presence { needed, optional };

// Of the bundle, or of the look at it.
using Problem = std::optional<std::variant<BundleProblem, QXError>>;

BundleProblem problem(std::string text) { return {std::move(text)}; }

void append(std::string& text, std::initializer_list<std::uint64_t> numbers) {
  for (const auto number : numbers) {
    if (!text.empty()) text += '.';
    text += std::to_string(number);
  }
}

std::string incarnationIn(const struct statx& status) {
  std::string result;
  // Zero where there is no time of birth.
  append(result, {::makedev(status.stx_dev_major, status.stx_dev_minor), status.stx_ino,
                  static_cast<std::uint64_t>(status.stx_btime.tv_sec), std::uint64_t{status.stx_btime.tv_nsec}});
  return result;
}

constexpr unsigned kIncarnation = STATX_TYPE | STATX_INO | STATX_BTIME;

// Reads text about the bundle's files into values and says what is wrong with the first that does not fit.
class Parser {
 public:
  Parser(const std::string& directory, QXPropertyLists& propertyLists) : directory_(directory), propertyLists_(propertyLists) {}

  Problem parse() {
    directoryDescriptor_.reset(::open(directory_.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!directoryDescriptor_) return failure(directory_, errno, "cannot be opened: " + std::system_category().message(errno));
    result_.bundle.directory = directory_;
    if (auto wrong = readDictionary(kInfoName, Presence::needed, result_.bundle.info)) return wrong;
    if (auto wrong = readDictionary(kEntitlementsName, Presence::optional, result_.bundle.entitlements)) return wrong;
    if (auto wrong = takeIdentifier()) return wrong;
    if (auto wrong = takeExecutable()) return wrong;
    if (auto wrong = takeGroups()) return wrong;
    if (auto wrong = takeGroupMembers()) return wrong;
    if (auto wrong = takeVersion()) return wrong;
    return takeIncarnation();
  }

  [[nodiscard]] ParsedBundle take() { return std::move(result_); }

 private:
  Problem readDictionary(const char* name, Presence presence, QXDictionary& target) {
    struct stat status {};
    if (::fstatat(directoryDescriptor_.get(), name, &status, AT_SYMLINK_NOFOLLOW) != 0) {
      if (errno == ENOENT && presence == Presence::optional) return std::nullopt;
      if (errno == ENOENT) return problem(std::string("has no ") + name);
      return failure(pathOf(name), errno, std::string(name) + ": " + std::system_category().message(errno));
    }
    if (!S_ISREG(status.st_mode)) return problem(std::string(name) + " is not a regular file");
    addVersion(status);
    // A stream does not say why it cannot be had; this does. While it is open nobody can have a lease on the list either.
    const UniqueDescriptor held(::openat(directoryDescriptor_.get(), name, O_RDONLY | O_NONBLOCK | O_NOCTTY | O_NOFOLLOW | O_CLOEXEC));
    if (!held) return failure(pathOf(name), errno, std::string(name) + " cannot be opened");
    const auto stream = propertyLists_.openStream(pathOf(name));
    if (!stream) return notSeen(pathOf(name), EMFILE);
    auto read = propertyLists_.read(*stream);
    if (read.error && stream->bad()) return notSeen(pathOf(name), EIO);
    if (read.error) return problem(std::string(name) + " is no property list: " + read.error->description());
    auto* dictionary = read.value ? read.value->as<QXDictionary>() : nullptr;
    if (dictionary == nullptr) return problem(std::string(name) + " holds no dictionary");
    target = std::move(*dictionary);
    return std::nullopt;
  }

  Problem takeIdentifier() {
    const auto* identifier = qxFind<std::string>(result_.bundle.info, kIdentifierKey);
    if (identifier == nullptr) return problem("Info.plist has no string " + std::string(kIdentifierKey));
    if (!isBundleIdentifier(*identifier)) return problem("its identifier is malformed");
    if (!hasSeveralParts(*identifier)) return problem("its identifier has a single part and needs two or more, like org.name");
    result_.bundle.identifier = *identifier;
    return std::nullopt;
  }

  Problem takeExecutable() {
    const auto* relative = qxFind<std::string>(result_.bundle.info, kExecutableKey);
    if (relative == nullptr || relative->empty()) return problem("Info.plist has no string " + std::string(kExecutableKey));
    // Not back through "..", where renames without end would keep it from being looked at, and others that wait for that.
    const std::string path = std::filesystem::path(*relative).lexically_normal().string();
    const UniqueDescriptor file = openInBundle(directoryDescriptor_.get(), path, LinksOnTheWay::none);
    if (!file) {
      if (errno == EAGAIN) return notSeen(pathOf(path), errno);
      if (errno == EXDEV) return problem("its executable lies outside the bundle");
      if (errno == ELOOP) return problem("its executable is a link, or lies behind one");
      return failure(pathOf(path), errno, "its executable cannot be opened: " + std::system_category().message(errno));
    }
    struct stat status {};
    if (::fstat(file.get(), &status) != 0) return notSeen(pathOf(path), errno);
    if (!S_ISREG(status.st_mode)) return problem("its executable is not a regular file");
    if ((status.st_mode & kExecutableBits) == 0) return problem("its executable may not be executed");
    addVersion(status);
    result_.bundle.executable = pathOf(path);
    return std::nullopt;
  }

  Problem takeStrings(const QXValue& value, std::string_view key, std::vector<std::string>& target) {
    const auto* array = value.as<QXArray>();
    if (array == nullptr) return problem(std::string(key) + " is not made of arrays of strings");
    for (const auto& element : *array) {
      const auto* text = element.as<std::string>();
      if (text == nullptr) return problem(std::string(key) + " is not made of arrays of strings");
      if (!isBundleIdentifier(*text)) return problem(std::string(key) + " has a malformed name");
      target.push_back(*text);
    }
    return std::nullopt;
  }

  Problem takeGroups() {
    const auto found = result_.bundle.info.find(kGroupsKey);
    return found == result_.bundle.info.end() ? std::nullopt : takeStrings(found->second, kGroupsKey, result_.wantedGroups);
  }

  Problem takeGroupMembers() {
    const auto found = result_.bundle.info.find(kGroupMembersKey);
    if (found == result_.bundle.info.end()) return std::nullopt;
    const auto* groups = found->second.as<QXDictionary>();
    if (groups == nullptr) return problem(std::string(kGroupMembersKey) + " is not a dictionary");
    for (const auto& [group, members] : *groups) {
      if (!isBundleIdentifier(group)) return problem(std::string(kGroupMembersKey) + " has a malformed name");
      if (auto wrong = takeStrings(members, kGroupMembersKey, result_.groupMembers[group])) return wrong;
    }
    return std::nullopt;
  }

  Problem takeVersion() {
    struct stat status {};
    if (::fstat(directoryDescriptor_.get(), &status) != 0) return notSeen(directory_, errno);
    addVersion(status);
    return std::nullopt;
  }

  Problem takeIncarnation() {
    struct statx status {};
    if (::statx(directoryDescriptor_.get(), "", AT_EMPTY_PATH, kIncarnation, &status) != 0) return notSeen(directory_, errno);
    result_.bundle.incarnation = incarnationIn(status);
    return std::nullopt;
  }

  void addVersion(const struct stat& status) {
    append(result_.bundle.version, {std::uint64_t{status.st_dev}, std::uint64_t{status.st_ino},
                                    static_cast<std::uint64_t>(status.st_ctim.tv_sec), static_cast<std::uint64_t>(status.st_ctim.tv_nsec)});
  }

  [[nodiscard]] std::string pathOf(const std::string& name) const { return directory_ + "/" + name; }

  // A call about something of the bundle failed.
  static Problem failure(const std::string& path, int error, std::string answer) {
    if (!isAnswer(error)) return notSeen(path, error);
    return problem(std::move(answer));
  }

  const std::string& directory_;
  QXPropertyLists& propertyLists_;
  UniqueDescriptor directoryDescriptor_;
  ParsedBundle result_;
};

}  // namespace

std::variant<ParsedBundle, BundleProblem, QXError> parseBundle(const std::string& directory, QXPropertyLists& propertyLists) {
  Parser parser(directory, propertyLists);
  auto wrong = parser.parse();
  if (!wrong) return parser.take();
  if (auto* error = std::get_if<QXError>(&*wrong)) return std::move(*error);
  return std::get<BundleProblem>(*std::move(wrong));
}

Seen<std::string> incarnationOf(const std::string& directory) {
  struct statx status {};
  if (::statx(AT_FDCWD, directory.c_str(), AT_SYMLINK_NOFOLLOW, kIncarnation, &status) != 0) {
    return isAnswer(errno) ? Seen<std::string>(std::string()) : notSeen(directory, errno);
  }
  return S_ISDIR(status.stx_mode) ? incarnationIn(status) : std::string();
}

}  // namespace docuvend::linux_platform
