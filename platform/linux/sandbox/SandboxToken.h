// What a sandbox token says, and its text.
//
// A token is a bearer capability: printable ASCII that names a file and proves that this session's daemon issued it. The grammar and a
// worked example stand in docs/tokens.md. Reading is strict: of one meaning there is one text, and nothing else is accepted.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <variant>

#include "platform/linux/sandbox/TokenKey.h"
#include "platform/linux/sandbox/TokenText.h"

namespace docuvend::linux_platform {

enum class TokenKind { readWrite };

enum class TokenRefusal {
  malformed,
  unknownVersion,
  unknownKind,
  notAuthentic,  // changed, made up, or issued under another key
  takenBack,     // issued before a cut
};

struct SandboxToken {
  static constexpr std::size_t kMaximumTextLength = 3 * kMaximumTokenPathLength + 144;
  static constexpr std::size_t kNonceLength = 16;
  using Nonce = std::array<std::uint8_t, kNonceLength>;

  TokenKind kind = TokenKind::readWrite;
  TokenNumber number = 1;
  std::string path;  // absolute, any bytes but NUL
  Nonce nonce{};     // makes two tokens for one file differ

  // `path` must be absolute and within its maximum.
  [[nodiscard]] std::string sealed(const TokenKey& key) const;
  [[nodiscard]] static std::variant<SandboxToken, TokenRefusal> opened(std::string_view text, const TokenKey& key);
  [[nodiscard]] static Nonce freshNonce();

  friend bool operator==(const SandboxToken&, const SandboxToken&) = default;
};

}  // namespace docuvend::linux_platform
