// The tokens of a login session: issued, read, and taken back below a directory.
//
// Holds the session's key and the floors of what was taken back, with the two files that keep them over a restart. Only the process that
// holds the platform's lock may have one for its files. May be used from any thread.
#pragma once

#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/QXError.h"
#include "platform/linux/base/Paths.h"
#include "platform/linux/sandbox/SandboxToken.h"
#include "platform/linux/sandbox/TokenFloors.h"
#include "platform/linux/sandbox/TokenKey.h"
#include "platform/linux/sandbox/UsesInFlight.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

// A good token, held on to by whoever acts on it.
struct TokenInUse {
  SandboxToken token;
  UsesInFlight::Use use;
};

class TokenSession {
 public:
  // Whoever takes tokens back waits so long, and no longer, for those who act on them.
  static constexpr std::chrono::milliseconds kLongestWaitForUses{5000};

  // Goes on with the files `tokenKey` and `tokenFloors`, whose directory exists. Without a key a new session begins. A key whose floors
  // are missing or cannot be trusted is renewed, with one line in the log: what had been taken back is not known any more. An error when
  // the key's file is not one, or a file cannot be written.
  // The log outlives it.
  [[nodiscard]] static std::variant<std::unique_ptr<TokenSession>, QXError> load(
      const Paths& paths, QXLogHandle& log, std::chrono::milliseconds longestWaitForUses = kLongestWaitForUses);
  TokenSession(std::string floorsFile, const TokenKey& key, TokenFloors floors, QXLogHandle& log,
               std::chrono::milliseconds longestWaitForUses = kLongestWaitForUses);

  // For a path free of links. None when tokens for it were taken back and that can still not be written down: after a restart such a
  // token could not be told from those that were taken back.
  [[nodiscard]] std::optional<std::string> issue(const std::string& path);

  [[nodiscard]] std::variant<SandboxToken, TokenRefusal> opened(std::string_view text) const;

  // The same for whoever acts on it: he holds the result until he is done. `takeBack` waits for him, but not for ever, so he asks
  // `isGood` before he hands anything out.
  [[nodiscard]] std::variant<TokenInUse, TokenRefusal> use(std::string_view text);
  [[nodiscard]] bool isGood(const SandboxToken& token) const;

  // When this returns no token that was issued before for a path below one of the directories (see TokenFloors) is good any more, and
  // nobody acts on one; also when the error says that a restart may make them good again. With EBUSY somebody still acts on one: he has not
  // come to his end in the longest time, which the log says too.
  [[nodiscard]] std::optional<QXError> takeBack(const std::vector<std::string>& directories);

  // Whether tokens may have been issued when the places that they may be for were others than this text describes.
  [[nodiscard]] bool hadOtherPlaces(std::string_view places) const;
  // From now on the places are these, and some directories are none any more: what was issued below them is taken back. Until that is
  // on disk nothing is issued. Waits for nobody who acts on a token.
  [[nodiscard]] std::optional<QXError> changePlaces(std::string_view places, const std::vector<std::string>& left);
  // Waits for those who act on tokens below the directories, as `takeBack` does.
  [[nodiscard]] std::optional<QXError> waitForUses(const std::vector<std::string>& directories);

 private:
  [[nodiscard]] std::optional<TokenNumber> issuableNumber(const std::string& path);
  // Makes the file say what the floors are, unless it does.
  [[nodiscard]] std::optional<QXError> save();

  const std::string floorsFile_;
  const TokenKey key_;
  QXLogHandle& log_;
  const std::chrono::milliseconds longestWaitForUses_;
  UsesInFlight uses_;
  std::mutex fileMutex_;  // held while the file is written; taken before mutex_
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  TokenFloors floors_;
  TokenFloors onDisk_;  // new tokens get its number
};

}  // namespace docuvend::linux_platform
