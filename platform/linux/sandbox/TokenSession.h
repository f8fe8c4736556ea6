// The tokens of a login session: issued, read, and taken back below a directory.
//
// Holds the session's key and the floors of what was taken back, with the two files that keep them over a restart. Only the process that
// holds the platform's lock may have one for its files. May be used from any thread.
#pragma once

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

class TokenSession {
 public:
  // Goes on with the files `tokenKey` and `tokenFloors`, whose directory exists. Without a key a new session begins. A key whose floors
  // are missing or cannot be trusted is renewed, with one line in the log: what had been taken back is not known any more. An error when
  // the key's file is not one, or a file cannot be written.
  [[nodiscard]] static std::variant<std::unique_ptr<TokenSession>, QXError> load(const Paths& paths, QXLogHandle& log);
  TokenSession(std::string floorsFile, const TokenKey& key, TokenFloors floors);

  // For a path free of links. None when tokens for it were taken back and that can still not be written down: after a restart such a
  // token could not be told from those that were taken back.
  [[nodiscard]] std::optional<std::string> issue(const std::string& path);

  [[nodiscard]] std::variant<SandboxToken, TokenRefusal> opened(std::string_view text) const;

  // Whoever acts on a token holds one of these from before `opened` until it is done; `takeBack` waits for it.
  [[nodiscard]] UsesInFlight::Use beginUse() { return uses_.begin(); }

  // When this returns no token that was issued before for a path below one of the directories (see TokenFloors) is good any more, and
  // nobody acts on one; also when the error says that a restart may make them good again.
  [[nodiscard]] std::optional<QXError> takeBack(const std::vector<std::string>& directories);

  // Whether tokens may have been issued when the places that they may be for were others than this text describes.
  [[nodiscard]] bool hadOtherPlaces(std::string_view places) const;
  // From now on the places are these, and some directories are none any more: what was issued below them is taken back. Until that is
  // on disk nothing is issued.
  [[nodiscard]] std::optional<QXError> changePlaces(std::string_view places, const std::vector<std::string>& left);

 private:
  [[nodiscard]] std::optional<TokenNumber> issuableNumber(const std::string& path);
  // Makes the file say what the floors are, unless it does.
  [[nodiscard]] std::optional<QXError> save();

  const std::string floorsFile_;
  const TokenKey key_;
  UsesInFlight uses_;
  std::mutex fileMutex_;  // held while the file is written; taken before mutex_
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  TokenFloors floors_;
  TokenFloors onDisk_;  // new tokens get its number
};

}  // namespace docuvend::linux_platform
