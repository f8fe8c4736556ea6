// A cut has three steps. The floors rise in memory: from then on no old token passes. The floors are written: from then on none passes
// after a restart either. Uses below the directories that had passed before are waited for: whoever opens or renames there after that has
// passed the new floors. A use is known by the path that its token names, and begins before the floors are looked at.
//
// The kernel may hold a use up for as long as somebody writes a file, for a rename and a change of mode stand in line with the writers. So
// the wait has an end, after which the cut says what it does not know to be over. Such a use finds its token taken back when it goes on,
// and hands nothing out; what the kernel had begun to rename is renamed.
//
// The number of new tokens follows the file, not the memory: it is raised when the floors that belong to it are on disk. So the file's
// number is never less than that of any token, and a cut that got lost with a crash or on a full disk leaves no token behind
// whose number a later cut would give out again. Until the file is written, nothing is issued below the directories that were cut, and
// nothing at all as long as it does not say what places tokens may be for.
//
// Floors are only as good as their memory. A file that is missing, damaged, cut short, another's or of another version would bring
// tokens back that had been taken, so its body is authenticated with the session's key, and where it does not hold the key goes with it.

#include "platform/linux/sandbox/TokenSession.h"

#include <cerrno>

#include "platform/QXLogMessage.h"
#include "platform/linux/files/PrivateFile.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::string_view kTag = "tag:";
constexpr int kIssueTries = 8;  // each costs a cut that came in between

std::string sealed(const TokenFloors& floors, const TokenKey& key) {
  std::string text = floors.printed();
  const TokenKey::Tag tag = key.authenticate(text);
  text += kTag;
  appendHex(text, tag);
  return text += '\n';
}

std::optional<TokenFloors> opened(std::string_view text, const TokenKey& key) {
  constexpr std::size_t kTagLineLength = kTag.size() + 2 * TokenKey::kTagLength + 1;
  if (text.size() < kTagLineLength || !text.ends_with('\n')) return std::nullopt;
  const std::string_view body = text.substr(0, text.size() - kTagLineLength);
  const std::string_view tagLine = text.substr(body.size(), kTagLineLength - 1);
  TokenKey::Tag tag{};
  if (!tagLine.starts_with(kTag) || !readHex(tagLine.substr(kTag.size()), tag) || !key.verifies(body, tag)) return std::nullopt;
  return TokenFloors::parsed(body);
}

std::optional<QXError> saveFloors(const std::string& path, const TokenFloors& floors, const TokenKey& key) {
  return writePrivateFile(path, sealed(floors, key));
}

std::variant<TokenFloors, QXError> loadFloors(const std::string& path, const TokenKey& key) {
  const auto read = readPrivateFile(path, TokenFloors::kMaximumTextLength);
  if (const auto* error = std::get_if<QXError>(&read)) return *error;
  auto floors = opened(std::get<std::string>(read), key);
  if (!floors) return QXError::system(EINVAL, path + " is damaged, of another key or of another version");
  return *std::move(floors);
}

}  // namespace

std::variant<std::unique_ptr<TokenSession>, QXError> TokenSession::load(const Paths& paths, QXLogHandle& log,
                                                                        std::chrono::milliseconds longestWaitForUses) {
  auto key = TokenKey::load(paths.tokenKey);
  if (const auto* error = std::get_if<QXError>(&key)) {
    if (error->code != ENOENT) return *error;
  } else {
    auto floors = loadFloors(paths.tokenFloors, std::get<TokenKey>(key));
    if (auto* known = std::get_if<TokenFloors>(&floors)) {
      return std::make_unique<TokenSession>(paths.tokenFloors, std::get<TokenKey>(key), std::move(*known), log, longestWaitForUses);
    }
    qxLog(log, "[NOTICE] No sandbox token issued until now is good any more: %@", std::get<QXError>(floors));
  }
  // The key first: what was issued under the old one is worthless from here, whatever becomes of the floors.
  key = TokenKey::renew(paths.tokenKey);
  if (const auto* error = std::get_if<QXError>(&key)) return *error;
  if (auto error = saveFloors(paths.tokenFloors, TokenFloors(), std::get<TokenKey>(key))) return *std::move(error);
  return std::make_unique<TokenSession>(paths.tokenFloors, std::get<TokenKey>(key), TokenFloors(), log, longestWaitForUses);
}

TokenSession::TokenSession(std::string floorsFile, const TokenKey& key, TokenFloors floors, QXLogHandle& log,
                           std::chrono::milliseconds longestWaitForUses)
    : floorsFile_(std::move(floorsFile)),
      key_(key),
      log_(log),
      longestWaitForUses_(longestWaitForUses),
      floors_(std::move(floors)),
      onDisk_(floors_) {}

// The number that a new token for the path may have: a good one that is on disk.
std::optional<TokenNumber> TokenSession::issuableNumber(const std::string& path) {
  for (int attempt = 0; attempt < kIssueTries; ++attempt) {
    {
      const std::lock_guard lock(mutex_);
      if (floors_.places() == onDisk_.places() && floors_.isGood(path, onDisk_.number())) return onDisk_.number();
    }
    if (save()) break;
  }
  return std::nullopt;
}

std::optional<std::string> TokenSession::issue(const std::string& path) {
  const auto number = issuableNumber(path);
  if (!number) return std::nullopt;
  SandboxToken token;
  token.number = *number;
  token.path = path;
  token.nonce = SandboxToken::freshNonce();
  return token.sealed(key_);
}

std::variant<SandboxToken, TokenRefusal> TokenSession::opened(std::string_view text) const {
  auto read = SandboxToken::opened(text, key_);
  const auto* token = std::get_if<SandboxToken>(&read);
  if (token != nullptr && !isGood(*token)) return TokenRefusal::takenBack;
  return read;
}

std::variant<TokenInUse, TokenRefusal> TokenSession::use(std::string_view text) {
  auto read = SandboxToken::opened(text, key_);
  if (const auto* refusal = std::get_if<TokenRefusal>(&read)) return *refusal;
  auto& token = std::get<SandboxToken>(read);
  auto use = uses_.begin(token.path);
  if (!isGood(token)) return TokenRefusal::takenBack;
  return TokenInUse{std::move(token), std::move(use)};
}

bool TokenSession::isGood(const SandboxToken& token) const {
  const std::lock_guard lock(mutex_);
  return floors_.isGood(token.path, token.number);
}

std::optional<QXError> TokenSession::takeBack(const std::vector<std::string>& directories) {
  {
    const std::lock_guard lock(mutex_);
    for (const std::string& directory : directories) floors_.raise(directory);
  }
  auto error = save();
  auto lateness = waitForUses(directories);
  return error ? error : lateness;
}

std::optional<QXError> TokenSession::waitForUses(const std::vector<std::string>& directories) {
  const auto late = uses_.waitForEarlier(directories, longestWaitForUses_);
  if (late.empty()) return std::nullopt;
  qxLog(log_, "[ERROR] Tokens were taken back, and what %d of them had begun before is still under way, the first of them for %@.",
        late.size(), late.front());
  return QXError::system(EBUSY, "the tokens were taken back, and what some of them had begun before is still under way");
}

bool TokenSession::hadOtherPlaces(std::string_view places) const {
  const std::lock_guard lock(mutex_);
  return floors_.places() && *floors_.places() != key_.authenticate(places);
}

std::optional<QXError> TokenSession::changePlaces(std::string_view places, const std::vector<std::string>& left) {
  {
    const std::lock_guard lock(mutex_);
    for (const std::string& directory : left) floors_.raise(directory);
    floors_.setPlaces(key_.authenticate(places));
  }
  return save();
}

std::optional<QXError> TokenSession::save() {
  const std::lock_guard oneAtATime(fileMutex_);
  TokenFloors floors;
  {
    const std::lock_guard lock(mutex_);
    if (floors_ == onDisk_) return std::nullopt;
    floors = floors_;
  }
  if (auto error = saveFloors(floorsFile_, floors, key_)) return error;
  const std::lock_guard lock(mutex_);
  onDisk_ = std::move(floors);
  return std::nullopt;
}

}  // namespace docuvend::linux_platform
