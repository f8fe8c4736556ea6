#include "platform/linux/sandbox/TokenKey.h"

#include <sodium.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>

#include "platform/linux/files/PrivateFile.h"

namespace docuvend::linux_platform {
namespace {

static_assert(TokenKey::kLength == crypto_auth_KEYBYTES);
static_assert(TokenKey::kTagLength == crypto_auth_BYTES);

// Everything here begins with this; without random bytes there is nothing to go on with.
void prepareLibrary() {
  static const bool ready = sodium_init() >= 0;
  if (!ready) std::abort();
}

const unsigned char* unsignedBytes(std::string_view text) { return reinterpret_cast<const unsigned char*>(text.data()); }

}  // namespace

void fillWithRandom(std::uint8_t* bytes, std::size_t count) {
  prepareLibrary();
  randombytes_buf(bytes, count);
}

TokenKey TokenKey::random() {
  TokenKey key;
  fillWithRandom(key.bytes_.data(), key.bytes_.size());
  return key;
}

TokenKey::~TokenKey() { sodium_memzero(bytes_.data(), bytes_.size()); }

std::variant<TokenKey, QXError> TokenKey::load(const std::string& path) {
  prepareLibrary();
  auto read = readPrivateFile(path, kLength);
  if (auto* error = std::get_if<QXError>(&read)) return std::move(*error);
  auto& contents = std::get<std::string>(read);
  if (contents.size() != kLength) return QXError::system(EINVAL, path + " has not the length of a key");
  TokenKey key;
  std::copy(contents.begin(), contents.end(), key.bytes_.begin());
  sodium_memzero(contents.data(), contents.size());
  return key;
}

std::variant<TokenKey, QXError> TokenKey::renew(const std::string& path) {
  TokenKey key = random();
  if (auto error = writePrivateFile(path, {reinterpret_cast<const char*>(key.bytes_.data()), kLength})) return *std::move(error);
  return key;
}

TokenKey::Tag TokenKey::authenticate(std::string_view text) const {
  Tag tag{};
  crypto_auth(tag.data(), unsignedBytes(text), text.size(), bytes_.data());
  return tag;
}

bool TokenKey::verifies(std::string_view text, const Tag& tag) const {
  return crypto_auth_verify(tag.data(), unsignedBytes(text), text.size(), bytes_.data()) == 0;
}

}  // namespace docuvend::linux_platform
