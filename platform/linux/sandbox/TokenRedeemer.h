// Turns tokens into open files, and renames a hidden sibling over its item.
//
// Whoever brings a good token is served; who that is does not matter here. May be used from any thread. `redeem` and `replaceItem` may wait
// in the kernel for as long as somebody else writes the same file, or changes the same directory; all else does not.
#pragma once

#include <optional>
#include <string_view>
#include <variant>

#include "platform/linux/sandbox/GroupContainers.h"
#include "platform/linux/sandbox/SandboxErrors.h"
#include "platform/linux/sandbox/TokenSession.h"

namespace docuvend::linux_platform {

enum class TokenUse { reading, writing };

struct RedeemedFile {
  UniqueDescriptor file;  // open for reading, or for reading and writing; blocking
  ObjectIdentity identity;
  std::string path;       // for which the token was
  UsesInFlight::Use use;  // a cut waits for whoever holds it
};

struct ReplacedItem {
  ObjectIdentity identity;     // what is the item now; its contents and mode are on disk
  std::string path;            // of the item
  TokenInUse inUse;            // the item's
  UniqueDescriptor directory;  // of the item; that it is the item is not on disk yet
};

class TokenRedeemer {
 public:
  // Both outlive it.
  TokenRedeemer(TokenSession& session, GroupContainers& containers) : session_(session), containers_(containers) {}

  using Redeemed = std::variant<RedeemedFile, QXError>;
  [[nodiscard]] Redeemed redeem(std::string_view token, TokenUse tokenUse) const;
  // The same, unless something would have to be waited for: then none, and nothing is changed.
  [[nodiscard]] std::optional<Redeemed> redeemAtOnce(std::string_view token, TokenUse tokenUse) const;

  // Whether the token is good now and names the file at that path, however the path is spelled. The file need not be there.
  [[nodiscard]] bool isFor(std::string_view token, const std::string& path) const;

  // The directory of what a token names that is good now, or why it is not. Neither is looked at.
  [[nodiscard]] std::variant<std::string, QXError> directoryOf(std::string_view token) const;

  // The item's new file has the permission bits of the old one.
  [[nodiscard]] std::variant<ReplacedItem, QXError> replaceItem(std::string_view itemToken, std::string_view siblingToken) const;

  // The rest of a replacement. It ends the use first, for nothing of the token's is done any more.
  [[nodiscard]] static std::optional<QXError> forceToDisk(ReplacedItem replaced);

 private:
  TokenSession& session_;
  GroupContainers& containers_;
};

}  // namespace docuvend::linux_platform
