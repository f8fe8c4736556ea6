// A token names a path, and between any two looks at a path others may have renamed what lies there. So a path is resolved once, to O_PATH
// descriptors of the directory and of the file; what is then examined, opened and handed out is that file and nothing else. Opening goes
// through the process's own descriptor, which names an object, not a path; it does not wait (a lease would make it), and afterwards
// the open file is compared with the one that was examined.
//
// A rename has no such form: it takes names. Both names are single components in one directory that is held open, so nothing outside that
// directory can be meant, and what has the item's name afterwards is compared with the sibling that was examined.
//
// A token may be taken back at any moment, too. Whatever comes of it happens within a use of it, which began before the floors were looked
// at: a cut that the token has not seen yet waits for the use to end. Forcing a sibling's contents to disk takes as long as its
// writer likes, so that comes before the use, and with it the item's mode, which needs no flush of its own then; the directory is forced
// when the use is over. A crash in between finds the item as it was or as it is to be.
//
// What makes, renames or changes a file stands in line, in the kernel, with those who write it: a rename for the file that it replaces, and
// meanwhile it has the directory locked, so that whoever makes or looks for another name there stands in line too. No call can be told not
// to wait. So what is done at once is only what needs no such lock: a file that the kernel knows by its name, and that this user may open.
// A cut gives up its wait in time; whoever comes out of the line then finds that his token is no good, and hands nothing out.
//
// Whoever is given an open file owns it, as all of this user's processes do, and may take the owner's own permission from it. It is given
// back to the file that was looked at when the next one comes with a token: a mode is no wall between bearers.

#include "platform/linux/sandbox/TokenRedeemer.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <optional>
#include <string>
#include <utility>

namespace docuvend::linux_platform {
namespace {

// What has the name was another file that often: somebody does it on purpose.
constexpr int kTries = 8;
constexpr mode_t kSiblingMode = 0600;
constexpr mode_t kPermissionBits = 0777;
constexpr mode_t kModeBits = 07777;
constexpr mode_t kOwnersAccess = 0600;
constexpr int kNeverWaiting = O_NONBLOCK | O_NOCTTY | O_CLOEXEC;

int accessMode(TokenUse use) { return use == TokenUse::writing ? O_RDWR : O_RDONLY; }

// The item's name, for the name of a hidden sibling.
std::optional<std::string> itemNameOf(const std::string& siblingName) {
  if (siblingName.size() < 2 || siblingName[0] != '.') return std::nullopt;
  return siblingName.substr(1);
}

struct OpenFile {
  UniqueDescriptor file;
  ObjectIdentity identity;
};

// The name has come to mean another file meanwhile, as when somebody saves atomically.
struct Exchanged {};

// It would have to be waited for.
struct WouldWait {};

// Gives the owner's permission back to a file of this user's that lacks it. False when that is not why it cannot be opened.
bool giveOwnersAccessBack(const PlacedFile& placed) {
  const auto examined = statusOf(placed.path.get());
  const auto* status = std::get_if<ObjectStatus>(&examined);
  if (status == nullptr || !S_ISREG(status->mode) || status->links != 1) return false;
  if ((status->mode & kOwnersAccess) == kOwnersAccess) return false;
  return ::chmod(descriptorPath(placed.path.get()).c_str(), (status->mode & kModeBits) | kOwnersAccess) == 0;
}

UniqueDescriptor openObject(const PlacedFile& placed, int access) {
  return UniqueDescriptor(::open(descriptorPath(placed.path.get()).c_str(), access | kNeverWaiting));
}

using Opening = std::variant<OpenFile, QXError, Exchanged, WouldWait>;

// Opens the object itself and makes sure that it is still a regular file with one link.
Opening openPlaced(const PlacedFile& placed, int access, Lookup lookup) {
  UniqueDescriptor file = openObject(placed, access);
  if (!file && errno == EACCES) {
    if (lookup == Lookup::inCacheAlone) return WouldWait{};
    // The refusal stands when there is nothing to give back.
    if (giveOwnersAccessBack(placed)) {
      file = openObject(placed, access);
    } else {
      errno = EACCES;
    }
  }
  if (!file) return sandboxErrorFor(SystemFailure{errno}, "the file cannot be opened");
  const auto examined = statusOf(file.get());
  if (const auto* failure = std::get_if<SystemFailure>(&examined)) return sandboxErrorFor(*failure, "the file cannot be examined");
  const auto& status = std::get<ObjectStatus>(examined);
  if (status.identity != placed.identity || !S_ISREG(status.mode)) return sandboxErrorFor(PathRefusal::notRegularFile);
  if (status.links == 0) return Exchanged{};
  if (status.links != 1) return sandboxErrorFor(PathRefusal::severalLinks);
  const int flags = ::fcntl(file.get(), F_GETFL);
  if (flags < 0 || ::fcntl(file.get(), F_SETFL, flags & ~O_NONBLOCK) != 0) {
    return sandboxErrorFor(SystemFailure{errno}, "the file cannot be made blocking");
  }
  return OpenFile{std::move(file), placed.identity};
}

// Makes the missing sibling, unless something has its name by now.
Opening createSibling(const PlacedItem& sibling) {
  UniqueDescriptor file(
      ::openat(sibling.directory.get(), sibling.name.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_NOCTTY | O_CLOEXEC, kSiblingMode));
  if (!file) {
    if (errno == EEXIST) return Exchanged{};
    return sandboxErrorFor(SystemFailure{errno}, "the hidden sibling cannot be created");
  }
  const auto examined = statusOf(file.get());
  if (const auto* failure = std::get_if<SystemFailure>(&examined))
    return sandboxErrorFor(*failure, "the hidden sibling cannot be examined");
  return OpenFile{std::move(file), std::get<ObjectStatus>(examined).identity};
}

bool itemOfSiblingExists(const PlacedItem& sibling) {
  const auto itemName = itemNameOf(sibling.name);
  if (!itemName) return false;
  const auto entry = placeEntry(sibling.directory.get(), *itemName);
  const auto* item = std::get_if<std::optional<PlacedFile>>(&entry);
  return item != nullptr && item->has_value();
}

std::optional<QXError> flush(int descriptor, const std::string& attempt) {
  if (::fsync(descriptor) != 0) return sandboxErrorFor(SystemFailure{errno}, attempt);
  return std::nullopt;
}

std::optional<QXError> flushDirectory(int directory) {
  const UniqueDescriptor readable(::openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!readable) return sandboxErrorFor(SystemFailure{errno}, "the directory cannot be opened");
  return flush(readable.get(), "the directory cannot be written");
}

// What the name of a hidden sibling means now.
bool isStillThere(const PlacedItem& item, const std::string& siblingName, const ObjectIdentity& sibling) {
  const auto entry = placeEntry(item.directory.get(), siblingName);
  const auto* present = std::get_if<std::optional<PlacedFile>>(&entry);
  return present != nullptr && *present && (*present)->identity == sibling;
}

// The item's permission bits on its hidden sibling. Unless they are to stay, the sibling gets back what it had: its next writer needs that.
// Others may replace the same item by the same sibling at once. So what has become the item meanwhile keeps them, and who is about to
// rename takes them again, since another who failed may have given them back.
class BorrowedMode {
 public:
  BorrowedMode(const PlacedItem& item, const std::string& siblingName, const OpenFile& sibling)
      : item_(item), siblingName_(siblingName), sibling_(sibling) {}
  BorrowedMode(const BorrowedMode&) = delete;
  BorrowedMode& operator=(const BorrowedMode&) = delete;
  ~BorrowedMode() {
    if (before_ && isStillThere(item_, siblingName_, sibling_.identity)) static_cast<void>(::fchmod(sibling_.file.get(), *before_));
  }

  [[nodiscard]] std::optional<QXError> take() {
    const auto itemStatus = statusOf(item_.file->path.get());
    const auto siblingStatus = statusOf(sibling_.file.get());
    for (const auto* status : {&itemStatus, &siblingStatus}) {
      if (const auto* failure = std::get_if<SystemFailure>(status)) return sandboxErrorFor(*failure, "the files cannot be examined");
    }
    const mode_t wanted = std::get<ObjectStatus>(itemStatus).mode & kPermissionBits;
    const mode_t present = std::get<ObjectStatus>(siblingStatus).mode & kPermissionBits;
    if (wanted == present) return std::nullopt;
    if (::fchmod(sibling_.file.get(), wanted) != 0) {
      return sandboxErrorFor(SystemFailure{errno}, "the hidden sibling cannot be given the item's mode");
    }
    if (!before_) before_ = present;
    return std::nullopt;
  }
  void stays() { before_.reset(); }

 private:
  const PlacedItem& item_;
  const std::string& siblingName_;
  const OpenFile& sibling_;
  std::optional<mode_t> before_;
};

QXError goneError() { return sandboxError(SandboxErrorCode::gone, "the file does not exist"); }

QXError badTokenError(TokenRefusal refusal) {
  const bool takenBack = refusal == TokenRefusal::takenBack;
  return sandboxError(SandboxErrorCode::badToken, takenBack ? "the token was taken back" : "the token is not valid");
}

std::string directoryOfPath(const std::string& path) { return path.substr(0, path.rfind('/') + 1); }

// The item's file, or the sibling that is made for it.
Opening openItem(const PlacedItem& item, TokenUse tokenUse, Lookup lookup) {
  if (item.file) return openPlaced(*item.file, accessMode(tokenUse), lookup);
  if (lookup == Lookup::inCacheAlone) return WouldWait{};
  if (tokenUse != TokenUse::writing || !itemOfSiblingExists(item)) return goneError();
  return createSibling(item);
}

using Attempt = std::variant<RedeemedFile, QXError, Exchanged, WouldWait>;

Attempt attempt(TokenSession& session, GroupContainers& containers, std::string_view text, TokenUse tokenUse, Lookup lookup) {
  auto begun = session.use(text);
  if (const auto* refusal = std::get_if<TokenRefusal>(&begun)) return badTokenError(*refusal);
  auto& [token, use] = std::get<TokenInUse>(begun);
  auto place = containers.place(token.path, lookup);
  if (const auto* refusal = std::get_if<PathRefusal>(&place)) {
    if (lookup == Lookup::inCacheAlone && *refusal == PathRefusal::unsteady) return WouldWait{};
    return sandboxErrorFor(*refusal);
  }
  auto& item = std::get<PlacedItem>(place);
  auto opened = openItem(item, tokenUse, lookup);
  if (auto* error = std::get_if<QXError>(&opened)) return std::move(*error);
  if (std::holds_alternative<Exchanged>(opened)) return Exchanged{};
  if (std::holds_alternative<WouldWait>(opened)) return WouldWait{};
  if (!session.isGood(token)) return badTokenError(TokenRefusal::takenBack);
  auto& [file, identity] = std::get<OpenFile>(opened);
  return RedeemedFile{std::move(file), identity, std::move(item.path), std::move(use)};
}

}  // namespace

TokenRedeemer::Redeemed TokenRedeemer::redeem(std::string_view token, TokenUse tokenUse) const {
  for (int tried = 0; tried < kTries; ++tried) {
    auto result = attempt(session_, containers_, token, tokenUse, Lookup::complete);
    if (auto* file = std::get_if<RedeemedFile>(&result)) return std::move(*file);
    if (auto* error = std::get_if<QXError>(&result)) return std::move(*error);
  }
  return sandboxErrorFor(PathRefusal::unsteady);
}

std::optional<TokenRedeemer::Redeemed> TokenRedeemer::redeemAtOnce(std::string_view token, TokenUse tokenUse) const {
  auto result = attempt(session_, containers_, token, tokenUse, Lookup::inCacheAlone);
  if (auto* file = std::get_if<RedeemedFile>(&result)) return std::move(*file);
  if (auto* error = std::get_if<QXError>(&result)) return std::move(*error);
  return std::nullopt;
}

bool TokenRedeemer::isFor(std::string_view token, const std::string& path) const {
  const auto begun = session_.use(token);
  const auto* inUse = std::get_if<TokenInUse>(&begun);
  if (inUse == nullptr) return false;
  const auto named = containers_.place(inUse->token.path);
  const auto meant = containers_.place(path);
  const auto* item = std::get_if<PlacedItem>(&named);
  const auto* file = std::get_if<PlacedItem>(&meant);
  return item != nullptr && file != nullptr && file->path == item->path;
}

std::variant<std::string, QXError> TokenRedeemer::directoryOf(std::string_view token) const {
  const auto opened = session_.opened(token);
  if (const auto* refusal = std::get_if<TokenRefusal>(&opened)) return badTokenError(*refusal);
  return directoryOfPath(std::get<SandboxToken>(opened).path);
}

std::variant<ReplacedItem, QXError> TokenRedeemer::replaceItem(std::string_view itemToken, std::string_view siblingToken) const {
  std::array<PlacedItem, 2> places;
  for (std::size_t i = 0; i < places.size(); ++i) {
    const auto opened = session_.opened(i == 0 ? itemToken : siblingToken);
    if (const auto* refusal = std::get_if<TokenRefusal>(&opened)) return badTokenError(*refusal);
    auto place = containers_.place(std::get<SandboxToken>(opened).path);
    if (const auto* refusal = std::get_if<PathRefusal>(&place)) return sandboxErrorFor(*refusal);
    places[i] = std::move(std::get<PlacedItem>(place));
  }
  auto& [item, sibling] = places;

  if (sibling.path != directoryOfPath(item.path) + "." + item.name) {
    return sandboxError(SandboxErrorCode::notSiblings, "the tokens do not name an item and its hidden sibling");
  }
  if (!item.file || !sibling.file) return goneError();
  // The item's directory serves for both names; the sibling must be there too.
  auto entry = placeEntry(item.directory.get(), sibling.name);
  if (const auto* refusal = std::get_if<PathRefusal>(&entry)) return sandboxErrorFor(*refusal);
  const auto& source = std::get<std::optional<PlacedFile>>(entry);
  if (!source || source->identity != sibling.file->identity) return goneError();

  auto opened = openPlaced(*source, O_RDONLY, Lookup::complete);
  if (auto* error = std::get_if<QXError>(&opened)) return std::move(*error);
  if (std::holds_alternative<Exchanged>(opened)) return goneError();
  const auto& file = std::get<OpenFile>(opened);
  BorrowedMode mode(item, sibling.name, file);
  if (auto error = mode.take()) return *std::move(error);
  if (auto error = flush(file.file.get(), "the hidden sibling cannot be written")) return *std::move(error);

  auto itemInUse = session_.use(itemToken);
  const auto siblingInUse = session_.use(siblingToken);
  for (const auto* begun : {&std::as_const(itemInUse), &siblingInUse}) {
    if (const auto* refusal = std::get_if<TokenRefusal>(begun)) return badTokenError(*refusal);
  }
  if (auto error = mode.take()) return *std::move(error);
  if (::renameat(item.directory.get(), sibling.name.c_str(), item.directory.get(), item.name.c_str()) != 0) {
    return sandboxErrorFor(SystemFailure{errno}, "the hidden sibling cannot be renamed");
  }
  mode.stays();

  auto after = placeEntry(item.directory.get(), item.name);
  if (const auto* refusal = std::get_if<PathRefusal>(&after)) return sandboxErrorFor(*refusal);
  const auto& now = std::get<std::optional<PlacedFile>>(after);
  if (!now || now->identity != source->identity) return sandboxError(SandboxErrorCode::gone, "the item was exchanged meanwhile");
  return ReplacedItem{source->identity, item.path, std::move(std::get<TokenInUse>(itemInUse)), std::move(item.directory)};
}

std::optional<QXError> TokenRedeemer::forceToDisk(ReplacedItem replaced) {
  { const auto over = std::move(replaced.inUse); }
  return flushDirectory(replaced.directory.get());
}

}  // namespace docuvend::linux_platform
