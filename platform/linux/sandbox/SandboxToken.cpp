#include "platform/linux/sandbox/SandboxToken.h"

#include <cassert>
#include <optional>

namespace docuvend::linux_platform {
namespace {

constexpr std::string_view kName = "docuvend-token";
constexpr std::string_view kVersion = "2";
constexpr std::string_view kReadWrite = "rw";
constexpr char kSeparator = ':';
constexpr std::size_t kFields = 7;

std::optional<std::array<std::string_view, kFields>> split(std::string_view text) {
  std::array<std::string_view, kFields> fields;
  for (std::size_t i = 0; i + 1 < kFields; ++i) {
    const auto end = text.find(kSeparator);
    if (end == std::string_view::npos) return std::nullopt;
    fields[i] = text.substr(0, end);
    text.remove_prefix(end + 1);
  }
  if (text.find(kSeparator) != std::string_view::npos) return std::nullopt;
  fields.back() = text;
  return fields;
}

}  // namespace

std::string SandboxToken::sealed(const TokenKey& key) const {
  assert(path.starts_with('/') && path.size() <= kMaximumTokenPathLength && kind == TokenKind::readWrite && number > 0);
  std::string text(kName);
  for (const std::string& field : {std::string(kVersion), std::string(kReadWrite), std::to_string(number), escapedPath(path)}) {
    text += kSeparator;
    text += field;
  }
  text += kSeparator;
  appendHex(text, nonce);
  const TokenKey::Tag tag = key.authenticate(text);
  text += kSeparator;
  appendHex(text, tag);
  return text;
}

std::variant<SandboxToken, TokenRefusal> SandboxToken::opened(std::string_view text, const TokenKey& key) {
  if (text.size() > kMaximumTextLength) return TokenRefusal::malformed;
  const auto fields = split(text);
  if (!fields || (*fields)[0] != kName) return TokenRefusal::malformed;
  if ((*fields)[1] != kVersion) return TokenRefusal::unknownVersion;
  if ((*fields)[2] != kReadWrite) return TokenRefusal::unknownKind;

  SandboxToken token;
  TokenKey::Tag tag{};
  const auto number = tokenNumberFrom((*fields)[3]);
  auto path = pathFrom((*fields)[4]);
  if (!number || !path) return TokenRefusal::malformed;
  if (!readHex((*fields)[5], token.nonce) || !readHex((*fields)[6], tag)) return TokenRefusal::malformed;
  const std::string_view authenticated = text.substr(0, text.size() - (*fields)[6].size() - 1);
  if (!key.verifies(authenticated, tag)) return TokenRefusal::notAuthentic;
  token.number = *number;
  token.path = std::move(*path);
  return token;
}

SandboxToken::Nonce SandboxToken::freshNonce() {
  Nonce nonce{};
  fillWithRandom(nonce.data(), nonce.size());
  return nonce;
}

}  // namespace docuvend::linux_platform
