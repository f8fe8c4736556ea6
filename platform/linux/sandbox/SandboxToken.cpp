#include "platform/linux/sandbox/SandboxToken.h"

#include <cassert>
#include <optional>

namespace docuvend::linux_platform {
namespace {

constexpr std::string_view kName = "docuvend-token";
constexpr std::string_view kVersion = "1";
constexpr std::string_view kReadWrite = "rw";
constexpr char kSeparator = ':';
constexpr std::size_t kFields = 6;
constexpr std::string_view kLowerHex = "0123456789abcdef";
constexpr std::string_view kUpperHex = "0123456789ABCDEF";

// Letters, digits and a few more stand for themselves in a path.
bool isPlain(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
         std::string_view("/-._~").find(c) != std::string_view::npos;
}

void appendByte(std::string& text, std::uint8_t byte, std::string_view digits) {
  text += digits[byte >> 4U];
  text += digits[byte & 15U];
}

std::optional<std::uint8_t> byteFrom(std::string_view two, std::string_view digits) {
  const auto high = digits.find(two[0]);
  const auto low = digits.find(two[1]);
  if (high == std::string_view::npos || low == std::string_view::npos) return std::nullopt;
  return static_cast<std::uint8_t>(high * 16 + low);
}

std::string escaped(std::string_view path) {
  std::string text;
  for (const char c : path) {
    if (isPlain(c)) {
      text += c;
    } else {
      text += '%';
      appendByte(text, static_cast<std::uint8_t>(c), kUpperHex);
    }
  }
  return text;
}

// None for an escape that was not needed, too: one path has one text.
std::optional<std::string> unescaped(std::string_view text) {
  std::string path;
  while (!text.empty()) {
    if (text[0] != '%') {
      if (!isPlain(text[0])) return std::nullopt;
      path += text[0];
      text.remove_prefix(1);
      continue;
    }
    if (text.size() < 3) return std::nullopt;
    const auto byte = byteFrom(text.substr(1, 2), kUpperHex);
    if (!byte || *byte == 0 || isPlain(static_cast<char>(*byte))) return std::nullopt;
    path += static_cast<char>(*byte);
    text.remove_prefix(3);
  }
  return path;
}

template <std::size_t N>
bool readHex(std::string_view text, std::array<std::uint8_t, N>& bytes) {
  if (text.size() != 2 * N) return false;
  for (std::size_t i = 0; i < N; ++i) {
    const auto byte = byteFrom(text.substr(2 * i, 2), kLowerHex);
    if (!byte) return false;
    bytes[i] = *byte;
  }
  return true;
}

template <std::size_t N>
void appendHex(std::string& text, const std::array<std::uint8_t, N>& bytes) {
  for (const std::uint8_t byte : bytes) appendByte(text, byte, kLowerHex);
}

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
  assert(path.starts_with('/') && path.size() <= kMaximumPathLength && kind == TokenKind::readWrite);
  std::string text(kName);
  for (const std::string_view field : {kVersion, kReadWrite}) {
    text += kSeparator;
    text += field;
  }
  text += kSeparator;
  text += escaped(path);
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
  auto path = unescaped((*fields)[3]);
  if (!path || !path->starts_with('/') || path->size() > kMaximumPathLength) return TokenRefusal::malformed;
  if (!readHex((*fields)[4], token.nonce) || !readHex((*fields)[5], tag)) return TokenRefusal::malformed;
  const std::string_view authenticated = text.substr(0, text.size() - (*fields)[5].size() - 1);
  if (!key.verifies(authenticated, tag)) return TokenRefusal::notAuthentic;
  token.path = std::move(*path);
  return token;
}

SandboxToken::Nonce SandboxToken::freshNonce() {
  Nonce nonce{};
  fillWithRandom(nonce.data(), nonce.size());
  return nonce;
}

}  // namespace docuvend::linux_platform
