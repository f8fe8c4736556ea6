#include "platform/linux/sandbox/SandboxToken.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "tests/sandbox/SandboxHouse.h"

namespace docuvend::linux_platform {
namespace {

constexpr const char* kNonceText = "000102030405060708090a0b0c0d0e0f";

SandboxToken tokenFor(std::string path) {
  SandboxToken token;
  token.number = 7;
  token.path = std::move(path);
  for (std::size_t i = 0; i < token.nonce.size(); ++i) token.nonce[i] = static_cast<std::uint8_t>(i);
  return token;
}

// Any text, with the tag that makes it authentic.
std::string authentic(const TokenKey& key, const std::string& text) {
  static constexpr std::string_view digits = "0123456789abcdef";
  std::string result = text + ":";
  for (const std::uint8_t byte : key.authenticate(text)) {
    result += digits[byte >> 4U];
    result += digits[byte & 15U];
  }
  return result;
}

TokenRefusal refusalOf(const std::string& text, const TokenKey& key) {
  const auto opened = SandboxToken::opened(text, key);
  if (const auto* refusal = std::get_if<TokenRefusal>(&opened)) return *refusal;
  ADD_FAILURE() << "accepted: " << text;
  return TokenRefusal::malformed;
}

TEST(SandboxToken, IsReadBackAsItWasWhateverBytesItsPathHas) {
  const TokenKey key = TokenKey::random();
  std::string everyByte = "/";
  for (int byte = 1; byte < 256; ++byte) everyByte += static_cast<char>(byte);
  for (const std::string& path : {std::string("/a/b.txt"), std::string("/Docuvend Storage/ü:%41.txt"), std::string("/\xff\xfe"), everyByte,
                                  "/" + std::string(kMaximumTokenPathLength - 1, '\x01')}) {
    const SandboxToken token = tokenFor(path);
    const std::string text = token.sealed(key);
    EXPECT_TRUE(std::all_of(text.begin(), text.end(), [](char c) { return c > ' ' && c < '\x7f'; })) << text;
    EXPECT_LE(text.size() + kMaximumTokenNumberDigits, SandboxToken::kMaximumTextLength);
    const auto opened = SandboxToken::opened(text, key);
    ASSERT_TRUE(std::holds_alternative<SandboxToken>(opened)) << text;
    EXPECT_EQ(std::get<SandboxToken>(opened), token) << text;
  }
}

TEST(SandboxToken, IsRefusedWithAnyBitChanged) {
  const TokenKey key = TokenKey::random();
  const std::string text = tokenFor("/home/u/Docuvend Storage/report.txt").sealed(key);
  for (std::size_t at = 0; at < text.size(); ++at) {
    for (unsigned bit = 0; bit < 8; ++bit) {
      std::string changed = text;
      changed[at] = static_cast<char>(static_cast<unsigned char>(changed[at]) ^ (1U << bit));
      EXPECT_TRUE(std::holds_alternative<TokenRefusal>(SandboxToken::opened(changed, key))) << changed;
    }
  }
}

TEST(SandboxToken, IsRefusedWhenItIsCutShortOrContinued) {
  const TokenKey key = TokenKey::random();
  const std::string text = tokenFor("/a/b").sealed(key);
  for (std::size_t length = 0; length < text.size(); ++length) {
    EXPECT_EQ(refusalOf(text.substr(0, length), key), TokenRefusal::malformed) << length;
  }
  for (const std::string more : {"0", ":", " ", "\n"}) EXPECT_EQ(refusalOf(text + more, key), TokenRefusal::malformed) << more;
  EXPECT_EQ(refusalOf(text + std::string(1, '\0'), key), TokenRefusal::malformed);
  EXPECT_EQ(refusalOf(" " + text, key), TokenRefusal::malformed);
  EXPECT_EQ(refusalOf(text + std::string(SandboxToken::kMaximumTextLength, '0'), key), TokenRefusal::malformed);
}

TEST(SandboxToken, IsNotAuthenticForAnotherPathNumberOrNonceOrUnderARenewedKey) {
  const TokenKey key = TokenKey::random();
  const std::string text = tokenFor("/a/b").sealed(key);
  const std::string tag = text.substr(text.rfind(':'));
  EXPECT_EQ(refusalOf(std::string("docuvend-token:2:rw:7:/a/c:") + kNonceText + tag, key), TokenRefusal::notAuthentic);
  EXPECT_EQ(refusalOf("docuvend-token:2:rw:7:/a/b:100102030405060708090a0b0c0d0e0f" + tag, key), TokenRefusal::notAuthentic);
  EXPECT_EQ(refusalOf(std::string("docuvend-token:2:rw:8:/a/b:") + kNonceText + tag, key), TokenRefusal::notAuthentic);
  EXPECT_EQ(refusalOf(text, TokenKey::random()), TokenRefusal::notAuthentic);
}

TEST(SandboxToken, IsReadStrictlyEvenWhenItIsAuthentic) {
  const TokenKey key = TokenKey::random();
  const std::string nonce = kNonceText;
  const std::string longest = "/" + std::string(kMaximumTokenPathLength, 'a');
  const std::vector<std::pair<std::string, TokenRefusal>> table = {
      {"docuvend-token:3:rw:7:/a:" + nonce, TokenRefusal::unknownVersion},
      {"docuvend-token:1:rw:7:/a:" + nonce, TokenRefusal::unknownVersion},
      {"docuvend-token:1:rw:/a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:02:rw:7:/a:" + nonce, TokenRefusal::unknownVersion},
      {"docuvend-token::rw:7:/a:" + nonce, TokenRefusal::unknownVersion},
      {"docuvend-token:2:ro:7:/a:" + nonce, TokenRefusal::unknownKind},
      {"docuvend-token:2::7:/a:" + nonce, TokenRefusal::unknownKind},
      {"Docuvend-token:2:rw:7:/a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:0:/a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:07:/a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:+7:/a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:-7:/a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7 :/a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7a:/a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw::/a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:1000000000000000000:/a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:a:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7::" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/a b:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/%:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/%4:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/%2G:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/%00:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/%41:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/%c3:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/\xc3\xa9:" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:" + longest + ":" + nonce, TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/a:", TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/a:" + nonce.substr(2), TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/a:" + nonce + "00", TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/a:000102030405060708090A0B0C0D0E0F", TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/a", TokenRefusal::malformed},
      {"docuvend-token:2:rw:7:/a:" + nonce + ":", TokenRefusal::malformed},
      {"", TokenRefusal::malformed},
  };
  for (const auto& [text, refusal] : table) EXPECT_EQ(refusalOf(authentic(key, text), key), refusal) << text;
  // The table's way of making texts makes good ones, too.
  for (const char* number : {"1", "10", "999999999999999999"}) {
    const auto opened = SandboxToken::opened(authentic(key, std::string("docuvend-token:2:rw:") + number + ":/a:" + nonce), key);
    ASSERT_TRUE(std::holds_alternative<SandboxToken>(opened)) << number;
    EXPECT_EQ(std::to_string(std::get<SandboxToken>(opened).number), number);
  }
  EXPECT_TRUE(std::holds_alternative<SandboxToken>(SandboxToken::opened(authentic(key, "docuvend-token:2:rw:7:/a:" + nonce), key)));
}

TEST(SandboxToken, DiffersFromAnyOtherForTheSameFile) { EXPECT_NE(SandboxToken::freshNonce(), SandboxToken::freshNonce()); }

}  // namespace
}  // namespace docuvend::linux_platform
