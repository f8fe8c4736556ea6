// The secret that makes this session's sandbox tokens authentic.
//
// Its bytes never leave the object but into the key file: everything else goes through `authenticate` and `verifies`. A new key makes
// every older token worthless. Only one process of a user has to do with the file: the one that holds the platform's lock.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <variant>

#include "platform/QXError.h"

namespace docuvend::linux_platform {

class TokenKey {
 public:
  static constexpr std::size_t kLength = 32;
  static constexpr std::size_t kTagLength = 32;
  using Tag = std::array<std::uint8_t, kTagLength>;

  // The key in that file; ENOENT when there is none. Any other error when the file is not a private one with the length of a key: such a
  // file is never used.
  [[nodiscard]] static std::variant<TokenKey, QXError> load(const std::string& path);
  // A new key in the place of whatever is there, on disk when this returns. After an error the file holds what it held, or a key that
  // nobody has used.
  [[nodiscard]] static std::variant<TokenKey, QXError> renew(const std::string& path);
  // A key that no file holds.
  [[nodiscard]] static TokenKey random();

  TokenKey(const TokenKey&) = default;
  TokenKey& operator=(const TokenKey&) = default;
  ~TokenKey();

  [[nodiscard]] Tag authenticate(std::string_view text) const;
  // Takes the same time whatever the tag.
  [[nodiscard]] bool verifies(std::string_view text, const Tag& tag) const;

 private:
  TokenKey() = default;

  std::array<std::uint8_t, kLength> bytes_{};
};

// Unpredictable bytes.
void fillWithRandom(std::uint8_t* bytes, std::size_t count);

}  // namespace docuvend::linux_platform
