// Turns tokens into open files, and renames a hidden sibling over its item.
//
// Whoever brings a good token is served; who that is does not matter here. May be used from any thread; blocks for the disk only.
#pragma once

#include <string_view>
#include <variant>

#include "platform/linux/sandbox/GroupContainers.h"
#include "platform/linux/sandbox/SandboxErrors.h"
#include "platform/linux/sandbox/SandboxToken.h"

namespace docuvend::linux_platform {

enum class TokenUse { reading, writing };

struct RedeemedFile {
  UniqueDescriptor file;  // open for reading, or for reading and writing; blocking
  ObjectIdentity identity;
};

class TokenRedeemer {
 public:
  // Both outlive it.
  TokenRedeemer(const TokenKey& key, GroupContainers& containers) : key_(key), containers_(containers) {}

  [[nodiscard]] std::variant<RedeemedFile, QXError> redeem(std::string_view token, TokenUse use) const;

  // What is the item now.
  [[nodiscard]] std::variant<ObjectIdentity, QXError> replaceItem(std::string_view itemToken, std::string_view siblingToken) const;

 private:
  [[nodiscard]] std::variant<PlacedItem, QXError> placed(std::string_view token) const;

  const TokenKey& key_;
  GroupContainers& containers_;
};

}  // namespace docuvend::linux_platform
