// The secret that makes this session's sandbox tokens authentic.
//
// Its bytes never leave the object but into the key file: everything else goes through `authenticate` and `verifies`. A new key makes
// every older token worthless.
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

  // The key in that file, which is made when it is missing. Two processes that make it at once end with the same key. An error when
  // the file is not a regular file of this user with mode 600, one link and the length of a key: such a file is never used or mended.
  [[nodiscard]] static std::variant<TokenKey, QXError> loadOrCreate(const std::string& path);
  // A new key in the place of whatever lies at that path. After an error the file holds what it held.
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

  [[nodiscard]] static std::variant<TokenKey, QXError> load(const std::string& path);
  [[nodiscard]] static int create(const std::string& path);

  std::array<std::uint8_t, kLength> bytes_{};
};

// Unpredictable bytes.
void fillWithRandom(std::uint8_t* bytes, std::size_t count);

}  // namespace docuvend::linux_platform
